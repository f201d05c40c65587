#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <variant>

namespace kvr {

/// An error, as described by the part that noticed it.
struct Error {
  std::string domain;     ///< the part that reports it, such as "files", "http", "json"
  std::int64_t code = 0;  ///< the domain's own number: errno, a curl code, 0 when there is none
  std::string message;

  friend bool operator==(const Error&, const Error&) = default;
};

/// The form used in log lines.
inline std::string describe(const Error& error) {
  return "Error Domain=" + error.domain + " Code=" + std::to_string(error.code) + " \"" + error.message +
         "\"";
}

/// A value, or the error that took its place.
template <class T>
class [[nodiscard]] Result {
 public:
  Result(T value) : state_(std::move(value)) {}      // NOLINT(google-explicit-constructor)
  Result(Error error) : state_(std::move(error)) {}  // NOLINT(google-explicit-constructor)

  explicit operator bool() const { return state_.index() == 0; }
  const T& operator*() const& { return std::get<0>(state_); }
  T&& operator*() && { return std::get<0>(std::move(state_)); }
  const T* operator->() const { return &std::get<0>(state_); }
  const Error& error() const { return std::get<1>(state_); }

 private:
  std::variant<T, Error> state_;
};

}  // namespace kvr
