// Where C calls C++: no exception passes, handles are checked, and the calling thread keeps the
// text of its last failure.
#pragma once

#include <algorithm>
#include <array>
#include <cstdint>
#include <exception>
#include <new>
#include <string_view>

namespace tally {

// The codes that every C header of ours has, by the same numbers.
constexpr int kCOk = 0;
constexpr int kCBadArgument = 1;
constexpr int kCNoMemory = 2;
constexpr int kCNotFound = 3;
constexpr int kCNoValue = 4;
constexpr int kCFailed = 6;

// Of the calling thread. Fixed, so that "out of memory" needs none.
inline constinit thread_local std::array<char, 256> cErrorText{};

// Keeps the text, cut where a character ends; returns the code.
inline int cFailure(int code, std::string_view text) noexcept {
  std::size_t size = std::min(text.size(), cErrorText.size() - 1);
  const auto isInside = [&](std::size_t at) {
    return at < text.size() && (static_cast<unsigned char>(text[at]) & 0xC0) == 0x80;
  };
  while (size > 0 && isInside(size)) --size;
  std::copy_n(text.begin(), size, cErrorText.begin());
  cErrorText[size] = '\0';
  return code;
}

// Runs what a C function does; an exception becomes its code.
template <class Body>
int cCall(Body body) noexcept {
  try {
    return body();
  } catch (const std::bad_alloc&) {
    return cFailure(kCNoMemory, "out of memory");
  } catch (const std::exception& exception) {
    return cFailure(kCFailed, exception.what());
  } catch (...) {
    return cFailure(kCFailed, "an unknown exception");
  }
}

// The base of what handles point to. The word in front tells their kinds apart, since other
// languages pass every handle as the same kind of pointer.
template <std::uint32_t Kind>
struct CHandle {
  static constexpr std::uint32_t kKind = Kind;
  const std::uint32_t kind = Kind;
};

// Null unless it is a handle of its type.
template <class T>
T* cHandle(T* handle) noexcept {
  return handle != nullptr && handle->kind == T::kKind ? handle : nullptr;
}

// Deletes a handle of the right kind.
template <class T>
void cRelease(T* handle) noexcept {
  delete cHandle(handle);
}

// Sets an output to what it is after a failure. False when it is null.
template <class T>
bool cClear(T* output, T value = T()) noexcept {
  if (output != nullptr) *output = value;
  return output != nullptr;
}

inline int cBadArgument(std::string_view text) noexcept { return cFailure(kCBadArgument, text); }

}  // namespace tally
