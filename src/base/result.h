// Result: a value, or the reason why there is none.
#pragma once

#include <string>
#include <utility>
#include <variant>

namespace tally {

// What went wrong, in words that an operator can act on; made where the failure is known.
struct Error {
  std::string message;
  int systemError = 0;  // errno where the failure was a system call's, else 0
};

template <class T>
class [[nodiscard]] Result {
 public:
  Result(T value) : state_(std::in_place_index<0>, std::move(value)) {}
  Result(Error error) : state_(std::in_place_index<1>, std::move(error)) {}
  explicit operator bool() const noexcept { return state_.index() == 0; }
  T& operator*() & { return std::get<0>(state_); }
  const T& operator*() const& { return std::get<0>(state_); }
  T&& operator*() && { return std::get<0>(std::move(state_)); }
  T* operator->() { return &std::get<0>(state_); }
  const T* operator->() const { return &std::get<0>(state_); }
  const Error& error() const { return std::get<1>(state_); }

 private:
  std::variant<T, Error> state_;
};

struct Done {};
// The result of an operation that yields nothing but success.
using Status = Result<Done>;

}  // namespace tally
