#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <new>
#include <type_traits>
#include <utility>

namespace orvanta::platform {

// A move-only callable: what std::move_only_function will be once every compiler we build with has it.
// Callables of up to 64 bytes are kept inside the object, so that a reply or a posted job costs no allocation.
// Calling an empty UniqueFunction throws std::bad_function_call.
template <class Signature>
class UniqueFunction;

template <class R, class... Args>
class UniqueFunction<R(Args...)> {
 public:
  UniqueFunction() noexcept = default;
  UniqueFunction(std::nullptr_t) noexcept {}  // NOLINT(google-explicit-constructor): mirrors std::function

  template <class F, class D = std::decay_t<F>,
            class = std::enable_if_t<!std::is_same_v<D, UniqueFunction> && std::is_invocable_r_v<R, D&, Args...>>>
  UniqueFunction(F&& f) {  // NOLINT(google-explicit-constructor): a lambda converts, as with std::function
    // NOLINTNEXTLINE(misc-redundant-expression): redundant for some D only
    if constexpr (sizeof(D) <= kInlineSize && alignof(D) <= alignof(std::max_align_t) &&
                  std::is_nothrow_move_constructible_v<D>) {
      ::new (static_cast<void*>(&_storage)) D(std::forward<F>(f));
      _operations = &kInlineOperations<D>;
    } else {
      ::new (static_cast<void*>(&_storage)) D*(new D(std::forward<F>(f)));
      _operations = &kHeapOperations<D>;
    }
  }

  UniqueFunction(UniqueFunction&& other) noexcept { takeFrom(other); }
  UniqueFunction& operator=(UniqueFunction&& other) noexcept {
    if (this != &other) {
      reset();
      takeFrom(other);
    }
    return *this;
  }
  UniqueFunction(const UniqueFunction&) = delete;
  UniqueFunction& operator=(const UniqueFunction&) = delete;
  ~UniqueFunction() { reset(); }

  explicit operator bool() const noexcept { return _operations != nullptr; }

  R operator()(Args... args) {
    if (_operations == nullptr) throw std::bad_function_call();
    return _operations->call(&_storage, std::forward<Args>(args)...);
  }

  void reset() noexcept {
    if (_operations != nullptr) std::exchange(_operations, nullptr)->destroy(&_storage);
  }

 private:
  static constexpr std::size_t kInlineSize = 64;

  struct Operations {
    R (*call)(void*, Args&&...);
    void (*move)(void* from, void* to) noexcept;
    void (*destroy)(void*) noexcept;
  };

  template <class D>
  static constexpr Operations kInlineOperations{
      [](void* p, Args&&... args) -> R { return (*static_cast<D*>(p))(std::forward<Args>(args)...); },
      [](void* from, void* to) noexcept {
        ::new (to) D(std::move(*static_cast<D*>(from)));
        static_cast<D*>(from)->~D();
      },
      [](void* p) noexcept { static_cast<D*>(p)->~D(); }};

  template <class D>
  static constexpr Operations kHeapOperations{
      [](void* p, Args&&... args) -> R { return (**static_cast<D**>(p))(std::forward<Args>(args)...); },
      [](void* from, void* to) noexcept { ::new (to) D*(*static_cast<D**>(from)); },
      [](void* p) noexcept { delete *static_cast<D**>(p); }};

  void takeFrom(UniqueFunction& other) noexcept {
    if (other._operations == nullptr) return;
    other._operations->move(&other._storage, &_storage);
    _operations = std::exchange(other._operations, nullptr);
  }

  alignas(std::max_align_t) std::byte _storage[kInlineSize];
  const Operations* _operations = nullptr;
};

}  // namespace orvanta::platform
