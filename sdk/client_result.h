#pragma once

#include <string>
#include <utility>
#include <variant>

namespace typhon {

/// Why an operation of the library failed.
struct ClientError {
    /// A D-Bus error name ("org.freedesktop.DBus.Error.AccessDenied"), also for failures found on this side.
    std::string name;
    /// What happened, for people.
    std::string message;
    /// What the application or its user can do about it; empty when nothing is known to help.
    std::string advice;
};

/// What an operation that gives nothing back gives back.
struct Done {};

/// A value, or why there is none. Access to the one that is not there throws std::bad_variant_access.
template <class T>
class [[nodiscard]] ClientResult {
public:
    ClientResult(T value) : outcome_(std::in_place_index<0>, std::move(value)) {}
    ClientResult(ClientError error) : outcome_(std::in_place_index<1>, std::move(error)) {}

    explicit operator bool() const noexcept { return outcome_.index() == 0; }
    T& operator*() { return std::get<0>(outcome_); }
    const T& operator*() const { return std::get<0>(outcome_); }
    T* operator->() { return &std::get<0>(outcome_); }
    const T* operator->() const { return &std::get<0>(outcome_); }
    const ClientError& error() const { return std::get<1>(outcome_); }

private:
    std::variant<T, ClientError> outcome_;
};

}  // namespace typhon
