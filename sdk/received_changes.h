#pragma once

#include "platform/ipc.h"
#include "sdk/font_change_notice.h"

#include <cstddef>
#include <deque>
#include <optional>

namespace typhon {

/// The changes that the daemon told of and the program has not asked for yet, and the grants that came with
/// all of them. One thread at a time.
class ReceivedChanges {
public:
    /// How many are kept for a program that does not ask; then the oldest go.
    static constexpr std::size_t most = 1024;

    /// Takes the arguments of `fontAddedInfo:addedURLStrings:removedURLStrings:`.
    void add(const Arguments& arguments);
    /// The oldest, or null.
    std::optional<FontChangeNotice> take();
    /// How many went unread.
    std::size_t lost() const { return lost_; }

    /// Takes grants for fonts, by path, that came by another way.
    void addFonts(const PropertyList& fonts);

    /// What the changes added to the last check-in, in its form.
    PropertyList grants() const;
    void forgetGrants();

private:
    void remember(const FontChangeNotice& notice);

    std::deque<FontChangeNotice> notices_;
    std::size_t lost_ = 0;
    PropertyList::Dictionary fonts_;
    std::optional<PropertyList> providerExtension_;
};

}  // namespace typhon
