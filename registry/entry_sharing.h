#pragma once

#include "platform/property_list.h"
#include "platform/sandbox.h"

#include <optional>
#include <string>

namespace typhon {

/// Issues a read extension in the form in which clients receive it: data that holds the token's text and
/// its terminating zero byte. Null when none was issued.
std::optional<PropertyList> issueExtensionData(Sandbox& sandbox, const AuditToken& token,
                                               const std::string& path);

/// Collects registry entries for one client, each with the extension that the client needs for its file.
class EntrySharing {
public:
    /// `sandbox` outlives this. `isTrusted`: the client gets no extension for single files, since it runs
    /// outside of any sandbox or may enumerate.
    EntrySharing(Sandbox& sandbox, const AuditToken& token, bool isTrusted)
        : sandbox_(sandbox), token_(token), isTrusted_(isTrusted)
    {}

    /// Adds the entry without its "disabled". With `noGrant`, or for a file of the asset store, no
    /// extension is tried. A file that a confined client can read by itself is left out.
    void add(const std::string& path, const PropertyList& entry, bool noGrant);

    /// Everything added, by path.
    PropertyList take() { return std::move(shared_); }

private:
    Sandbox& sandbox_;
    AuditToken token_;
    bool isTrusted_;
    PropertyList::Dictionary shared_;
};

}  // namespace typhon
