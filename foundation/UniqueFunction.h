#pragma once

#include <cstddef>
#include <memory>
#include <new>
#include <type_traits>
#include <utility>

namespace telvane {

template <class Signature>
class UniqueFunction;

// A move-only callable, so that a completion can own what it needs and is called by exactly one owner. Callables of up
// to kInlineSize bytes are kept inside without an allocation. Calling an empty one is not allowed.
template <class R, class... Args>
class UniqueFunction<R(Args...)> {
 public:
  static constexpr size_t kInlineSize = 48;

  UniqueFunction() noexcept = default;
  UniqueFunction(std::nullptr_t) noexcept {}
  // The requirement leaves moves to the move constructor.
  template <class F>
  requires(!std::is_same_v<std::remove_cvref_t<F>, UniqueFunction> &&
           std::is_invocable_r_v<R, std::decay_t<F>&, Args...>)
      UniqueFunction(F&& callable) {  // NOLINT(bugprone-forwarding-reference-overload)
    using Callable = std::decay_t<F>;
    if constexpr (isInline<Callable>()) {
      ::new (static_cast<void*>(&_storage)) Callable(std::forward<F>(callable));
      _operations = &kInlineOperations<Callable>;
    } else {
      ::new (static_cast<void*>(&_storage)) Callable*(new Callable(std::forward<F>(callable)));
      _operations = &kHeapOperations<Callable>;
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
  UniqueFunction& operator=(std::nullptr_t) noexcept {
    reset();
    return *this;
  }
  UniqueFunction(const UniqueFunction&) = delete;
  UniqueFunction& operator=(const UniqueFunction&) = delete;
  ~UniqueFunction() { reset(); }

  R operator()(Args... arguments) { return _operations->invoke(&_storage, std::forward<Args>(arguments)...); }
  explicit operator bool() const noexcept { return _operations != nullptr; }

 private:
  struct Operations {
    R (*invoke)(void*, Args&&...);
    void (*moveTo)(void* from, void* to) noexcept;
    void (*destroy)(void*) noexcept;
  };

  template <class Callable>
  static constexpr bool isInline() {
    return sizeof(Callable) <= kInlineSize && alignof(Callable) <= alignof(std::max_align_t) &&
           std::is_nothrow_move_constructible_v<Callable>;
  }

  template <class Callable>
  static constexpr Operations kInlineOperations = {
      [](void* storage, Args&&... arguments) -> R {
        return static_cast<R>((*static_cast<Callable*>(storage))(std::forward<Args>(arguments)...));
      },
      [](void* from, void* to) noexcept {
        ::new (to) Callable(std::move(*static_cast<Callable*>(from)));
        static_cast<Callable*>(from)->~Callable();
      },
      [](void* storage) noexcept { static_cast<Callable*>(storage)->~Callable(); }};

  template <class Callable>
  static constexpr Operations kHeapOperations = {
      [](void* storage, Args&&... arguments) -> R {
        return static_cast<R>((**static_cast<Callable**>(storage))(std::forward<Args>(arguments)...));
      },
      [](void* from, void* to) noexcept { ::new (to) Callable*(*static_cast<Callable**>(from)); },
      [](void* storage) noexcept { std::unique_ptr<Callable> owned(*static_cast<Callable**>(storage)); }};

  void takeFrom(UniqueFunction& other) noexcept {
    if (other._operations == nullptr) return;
    other._operations->moveTo(&other._storage, &_storage);
    _operations = std::exchange(other._operations, nullptr);
  }
  void reset() noexcept {
    if (_operations != nullptr) std::exchange(_operations, nullptr)->destroy(&_storage);
  }

  const Operations* _operations = nullptr;
  alignas(std::max_align_t) std::byte _storage[kInlineSize];
};

// A piece of work for a queue, called at most once.
using Job = UniqueFunction<void()>;

}  // namespace telvane
