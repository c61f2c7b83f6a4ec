// The outcome of an operation that can fail: its value, or an error.
#pragma once

#include <cerrno>
#include <concepts>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <variant>

namespace vesk {

/// Why an operation failed.
struct Error {
  /// Distinguishes the causes that a caller treats differently.
  enum class Kind : unsigned char {
    Failed,     ///< the system or a library failed, or any cause without a kind of its own
    Missing,    ///< there is no such file
    Exists,     ///< the file is already there
    Busy,       ///< another process holds what is needed
    Untrusted,  ///< the file may have been written by somebody who must not decide its contents
    Malformed,  ///< the input is not of the expected form, or exceeds a limit
    TimedOut,   ///< it took too long, or the caller gave it up
  };

  Kind kind = Kind::Failed;
  std::string text;  ///< a clause for a log line that names the cause, without a full stop
  int number = 0;    ///< the system's error number; 0 if the system reported none
};

/// The error for a number of errno, with the system's text for it; `subject`, if there is one, comes before
/// the text and a colon.
inline Error systemError(int number, std::string subject = {}) {
  auto kind = Error::Kind::Failed;
  if (number == ENOENT || number == ENOTDIR) kind = Error::Kind::Missing;
  if (number == EEXIST) kind = Error::Kind::Exists;
  if (number == EWOULDBLOCK) kind = Error::Kind::Busy;
  if (!subject.empty()) subject += ": ";
  return {kind, subject + std::generic_category().message(number), number};
}

/// The error for input of the wrong form.
inline Error malformed(std::string text) { return {Error::Kind::Malformed, std::move(text)}; }

/// Holds a value or an error. Both convert to it, so a function returns either:
///
///     Result<std::string> read(…) {
///       if (…) return systemError(errno);
///       return bytes;
///     }
///     auto bytes = read(…);
///     if (!bytes) return bytes.error();
///
/// A function that returns it throws nothing for the failures that it describes. Where nothing can go wrong
/// but a thing may be absent, use std::optional. Reading the value of a failure, or the error of a success,
/// is undefined. As thread-safe as its value.
template <class T>
class [[nodiscard]] Result {
 public:
  template <std::convertible_to<T> Source = T>
  Result(Source&& value) : _outcome(std::in_place_index<0>, std::forward<Source>(value)) {}
  Result(Error error) : _outcome(std::in_place_index<1>, std::move(error)) {}

  /// Whether it succeeded.
  explicit operator bool() const noexcept { return _outcome.index() == 0; }

  T& operator*() & noexcept { return *std::get_if<0>(&_outcome); }
  const T& operator*() const& noexcept { return *std::get_if<0>(&_outcome); }
  T&& operator*() && noexcept { return std::move(*std::get_if<0>(&_outcome)); }
  T* operator->() noexcept { return std::get_if<0>(&_outcome); }
  const T* operator->() const noexcept { return std::get_if<0>(&_outcome); }

  const Error& error() const& noexcept { return *std::get_if<1>(&_outcome); }
  Error error() && noexcept { return std::move(*std::get_if<1>(&_outcome)); }

 private:
  std::variant<T, Error> _outcome;
};

/// Success, which is the default, or an error.
template <>
class [[nodiscard]] Result<void> {
 public:
  Result() noexcept = default;
  Result(Error error) : _error(std::move(error)) {}

  explicit operator bool() const noexcept { return !_error; }
  const Error& error() const& noexcept { return *_error; }
  Error error() && noexcept { return *std::move(_error); }

 private:
  std::optional<Error> _error;
};

}  // namespace vesk
