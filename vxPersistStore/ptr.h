// Interface pointers: an object and the function table through which it is used.
#pragma once

#include <type_traits>

namespace vemo {

// Stands for the null interface pointer.
struct NullInterface {
  constexpr operator void*() const noexcept { return nullptr; }
};
inline constexpr NullInterface null{};

struct AnyInterface {
  void* m_self = nullptr;
  const void* m_table = nullptr;

  constexpr AnyInterface() noexcept = default;
  constexpr AnyInterface(void* self, const void* table) noexcept : m_self(self), m_table(table) {}
};

// Owns and counts nothing. `I` is IObject or IPersistable, constant or not.
template <class I>
class ptr : public AnyInterface {
 public:
  using Interface = std::remove_const_t<I>;

  constexpr ptr() noexcept = default;
  constexpr ptr(NullInterface) noexcept {}
  constexpr ptr(void* self, const typename Interface::FnTable* table) noexcept : AnyInterface(self, table) {}

  // From an object of a class that has tables (not from an untyped pointer).
  template <class T>
    requires(!std::is_void_v<T> && (std::is_const_v<I> || !std::is_const_v<T>))
  ptr(T* object) noexcept {
    CoerceFrom(object);
  }

  ptr(const ptr<Interface>& other) noexcept
    requires std::is_const_v<I>
      : AnyInterface(other) {}
  ptr(const ptr&) noexcept = default;
  ptr& operator=(const ptr&) noexcept = default;

  template <class T>
  void CoerceFrom(T* object) noexcept {
    m_self = const_cast<std::remove_const_t<T>*>(object);
    m_table = Interface::template Stubs<std::remove_const_t<T>>::GetTable();
  }

  explicit operator void*() const noexcept { return m_self; }

  const typename Interface::FnTable* Table() const noexcept {
    return static_cast<const typename Interface::FnTable*>(m_table);
  }
};

}  // namespace vemo
