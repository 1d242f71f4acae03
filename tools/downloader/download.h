#pragma once

namespace typhon {

/// Takes a request from the socket, gives up all rights that the work does not need, does it, and answers.
/// Once, for a process that ends then, without threads of its own.
void serveDownload(int socket);

}  // namespace typhon
