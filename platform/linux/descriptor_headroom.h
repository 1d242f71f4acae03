#pragma once

namespace typhon {

/// Whether `newest`, a descriptor that was opened just now, is one of the last that this process may open: of
/// those kept back from newcomers, so that whoever is connected can be served. They are 128, or a quarter of
/// the limit where that is less. Any thread.
bool isWithinDescriptorHeadroom(int newest);

}  // namespace typhon
