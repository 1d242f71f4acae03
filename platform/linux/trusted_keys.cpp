#include "platform/linux/trusted_keys.h"

#include "platform/linux/trusted_directory.h"

#include <algorithm>

#include <sys/stat.h>

namespace typhon {

namespace {

constexpr std::size_t maximumKeys = 256;
constexpr std::size_t keyFileLimit = 64 * 1024;

std::optional<FileIdentity> stateOf(const std::string& path)
{
    struct stat status;
    return ::lstat(path.c_str(), &status) == 0 ? std::optional(FileIdentity(status)) : std::nullopt;
}

}  // namespace

bool TrustedKeys::Seen::isSettled() const
{
    return (!directory || directory->isSettled()) && std::ranges::all_of(files, [](const auto& file) {
               return file.second && file.second->isSettled();
           });
}

bool TrustedKeys::isUnchanged() const
{
    const auto directory = root_.real(directory_);
    return stateOf(directory) == seen_.directory && std::ranges::all_of(seen_.files, [&](const auto& file) {
               return stateOf(directory + "/" + file.first) == file.second;
           });
}

TrustedKeys::Snapshot TrustedKeys::current()
{
    const std::lock_guard lock(mutex_);
    if (!keys_ || !isSettled_ || !isUnchanged()) {
        load();
    }
    return keys_;
}

void TrustedKeys::load()
{
    const auto directoryPath = root_.real(directory_);
    Seen seen{stateOf(directoryPath), {}};
    auto keys = std::make_shared<std::vector<TrustedKey>>();
    const auto directory = TrustedDirectory::open(root_, directory_);
    std::vector<std::string> complaints;
    if (!directory.value) {
        complaints.push_back(directory.error);
    }
    for (const auto& name : directory.value ? directory.value->propertyLists() : std::vector<std::string>{}) {
        if (seen.files.size() == maximumKeys) {
            complaints.push_back(directoryPath + " holds too many keys");
            break;
        }
        seen.files.emplace_back(name, stateOf(directoryPath + "/" + name));
        const auto bytes = directory.value->read(name, keyFileLimit);
        auto key =
            bytes.value ? decodeTrustedKey(*bytes.value) : Result<TrustedKey>{std::nullopt, bytes.error};
        if (key.value) {
            keys->push_back(std::move(*key.value));
        } else {
            complaints.push_back(directoryPath + "/" + name + ": " + key.error);
        }
    }
    const bool isNews = !keys_ || seen != seen_;
    for (const auto& complaint : isNews ? complaints : std::vector<std::string>{}) {
        TYLog_Error(log_, "trusted key does not count: " + complaint);
    }
    keys_ = std::move(keys);
    isSettled_ = seen.isSettled();
    seen_ = std::move(seen);
}

bool isTrusted(const std::vector<TrustedKey>& keys, const PublicKey& key, const CodeStatement& statement)
{
    return std::ranges::any_of(keys, [&](const TrustedKey& trusted) {
        return trusted.key == key && trusted.scope.admits(statement);
    });
}

}  // namespace typhon
