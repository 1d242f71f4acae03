#include "registry/user_font_updates.h"

namespace typhon {

WorkQueue& UserFontUpdates::queue()
{
    return queues_.serialQueue("com.vorlan.typhon.UpdatingUserFonts");
}

Task<void> UserFontUpdates::updatingUserFonts(std::function<void()> block)
{
    return queue().perform(std::move(block));
}

void UserFontUpdates::updatingUserFontsAndWait(const std::function<void()>& block)
{
    queue().sync(block);
}

}  // namespace typhon
