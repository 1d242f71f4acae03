#pragma once

#include <cstddef>
#include <list>
#include <map>
#include <optional>
#include <utility>

namespace typhon {

/// Remembers the most recently used values, at most `capacity` of them. One thread at a time.
template <class Key, class Value>
class BoundedCache {
public:
    explicit BoundedCache(std::size_t capacity) : capacity_(capacity) {}

    std::optional<Value> find(const Key& key)
    {
        const auto found = byKey_.find(key);
        if (found == byKey_.end()) {
            return std::nullopt;
        }
        entries_.splice(entries_.begin(), entries_, found->second);
        return found->second->second;
    }

    void store(const Key& key, Value value)
    {
        if (const auto found = byKey_.find(key); found != byKey_.end()) {
            entries_.erase(found->second);
            byKey_.erase(found);
        }
        entries_.emplace_front(key, std::move(value));
        byKey_[key] = entries_.begin();
        if (entries_.size() > capacity_) {
            byKey_.erase(entries_.back().first);
            entries_.pop_back();
        }
    }

    void erase(const Key& key)
    {
        if (const auto found = byKey_.find(key); found != byKey_.end()) {
            entries_.erase(found->second);
            byKey_.erase(found);
        }
    }

    std::size_t size() const { return entries_.size(); }

private:
    std::size_t capacity_;
    std::list<std::pair<Key, Value>> entries_;
    std::map<Key, typename std::list<std::pair<Key, Value>>::iterator> byKey_;
};

}  // namespace typhon
