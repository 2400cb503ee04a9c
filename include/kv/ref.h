// KvRef: the owning pointer of the value model.
#pragma once

#include <cstddef>
#include <type_traits>
#include <utility>

namespace tally {

// Owns one reference to a KvObject (or is null). Functions named Copy or Create return a KvRef;
// functions named Get return a plain pointer that lives as long as the container it came from.
template <class T>
class KvRef {
 public:
  KvRef() noexcept = default;
  KvRef(std::nullptr_t) noexcept {}
  KvRef(const KvRef& other) noexcept : object_(other.object_) { retain(); }
  KvRef(KvRef&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
  template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
  KvRef(const KvRef<U>& other) noexcept : object_(other.get()) {
    retain();
  }
  template <class U, class = std::enable_if_t<std::is_convertible_v<U*, T*>>>
  KvRef(KvRef<U>&& other) noexcept : object_(other.leak()) {}
  ~KvRef() {
    if (object_ != nullptr) object_->release();
  }
  KvRef& operator=(KvRef other) noexcept {
    std::swap(object_, other.object_);
    return *this;
  }

  // Takes over the reference that the caller owns.
  static KvRef adopt(T* object) noexcept {
    KvRef ref;
    ref.object_ = object;
    return ref;
  }
  // Adds a reference to a borrowed object; null gives a null KvRef.
  static KvRef share(T* object) noexcept {
    if (object != nullptr) object->retain();
    return adopt(object);
  }

  T* get() const noexcept { return object_; }
  T* operator->() const noexcept { return object_; }
  T& operator*() const noexcept { return *object_; }
  explicit operator bool() const noexcept { return object_ != nullptr; }
  // Gives the reference up to the caller, who must release it.
  T* leak() noexcept { return std::exchange(object_, nullptr); }

 private:
  void retain() const noexcept {
    if (object_ != nullptr) object_->retain();
  }
  T* object_ = nullptr;
};

}  // namespace tally
