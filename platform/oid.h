// Persistent object ids.
#pragma once

#include <cstdint>
#include <functional>

namespace vemo {

// One 64-bit value, ordered as an unsigned number; 0 is null.
struct Seid {
  std::uint64_t m_value = 0;

  constexpr std::uint32_t SeidHigh() const noexcept { return static_cast<std::uint32_t>(m_value >> 32); }
  constexpr std::uint32_t SeidLow() const noexcept { return static_cast<std::uint32_t>(m_value); }

  friend constexpr bool operator==(const Seid& a, const Seid& b) noexcept { return a.m_value == b.m_value; }
  friend constexpr bool operator<(const Seid& a, const Seid& b) noexcept { return a.m_value < b.m_value; }
};

struct OID : Seid {
  constexpr OID() noexcept = default;
  constexpr explicit OID(std::uint64_t value) noexcept : Seid{value} {}

  constexpr bool IsNull() const noexcept { return m_value == 0; }

  friend constexpr bool operator==(const OID& a, const OID& b) noexcept {
    return static_cast<const Seid&>(a) == static_cast<const Seid&>(b);
  }
  friend constexpr bool operator<(const OID& a, const OID& b) noexcept {
    return static_cast<const Seid&>(a) < static_cast<const Seid&>(b);
  }
};

}  // namespace vemo

template <>
struct std::hash<vemo::OID> {
  std::size_t operator()(const vemo::OID& oid) const noexcept { return std::hash<std::uint64_t>()(oid.m_value); }
};
