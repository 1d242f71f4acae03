#include "platform/linux/message_looks.h"

namespace typhon {

namespace {

thread_local MessageLooks* current = nullptr;

}  // namespace

MessageLooks::MessageLooks() : outer_(current)
{
    current = this;
}

MessageLooks::~MessageLooks()
{
    current = outer_;
}

SeenOfProcess* MessageLooks::of(const AuditToken& token)
{
    if (current == nullptr) {
        return nullptr;
    }
    if (current->token_ == AuditToken{}) {
        current->token_ = token;
    }
    return current->token_ == token ? &current->seen_ : nullptr;
}

}  // namespace typhon
