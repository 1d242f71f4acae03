#include "fontmanager/kept_font_record.h"

#include "fontmanager/profile_fonts.h"

#include <utility>

namespace typhon {

PropertyList KeptFontRecord::read()
{
    const std::lock_guard lock(mutex_);
    auto opened = openRegularFile(path_);
    const FileIdentity identity(opened.status);
    if (opened.error == 0 && file_ && identity == identity_) {
        return record_;
    }
    const bool isSettled = opened.error == 0 && identity.isSettled();
    auto record = fontRecordIn(opened);
    file_ = isSettled ? std::move(opened.file) : FileDescriptor();
    identity_ = identity;
    record_ = isSettled ? record : PropertyList();
    return record;
}

}  // namespace typhon
