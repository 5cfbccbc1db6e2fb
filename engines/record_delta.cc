#include "engines/record_delta.h"

#include <algorithm>
#include <bit>
#include <cstring>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

namespace {

// Stretches that agree in so many bytes are taken to be the same.
constexpr std::size_t kAnchorBytes = 8;
// How far from where two versions part they are compared at every pair of distances.
constexpr std::size_t kNearBytes = 24;
// How far the one may have grown or shrunk against the other.
constexpr std::size_t kFarBytes = 1024;
// What a delta of a few changes fits in.
constexpr std::size_t kUsualBytes = 256;

std::uint64_t Anchor(ByteView bytes, std::size_t at) noexcept {
  std::uint64_t anchor;
  static_assert(sizeof(anchor) == kAnchorBytes);
  std::memcpy(&anchor, bytes.data() + at, sizeof(anchor));
  return anchor;
}

// Two words a step. In little-endian ones the first byte that differs has the lowest bit that does.
std::size_t CommonPrefix(ByteView a, ByteView b) noexcept {
  const std::size_t most = std::min(a.size(), b.size());
  std::size_t n = 0;
  for (; n + 2 * kAnchorBytes <= most; n += 2 * kAnchorBytes) {
    const std::uint64_t first = Anchor(a, n) ^ Anchor(b, n);
    const std::uint64_t second = Anchor(a, n + kAnchorBytes) ^ Anchor(b, n + kAnchorBytes);
    if ((first | second) == 0) continue;
    return first != 0 ? n + static_cast<std::size_t>(std::countr_zero(first)) / 8
                      : n + kAnchorBytes + static_cast<std::size_t>(std::countr_zero(second)) / 8;
  }
  while (n < most && a[n] == b[n]) ++n;
  return n;
}

// Where `needle`'s first bytes stand in the first kFarBytes of `bytes`.
std::optional<std::size_t> FindAnchor(ByteView bytes, ByteView needle) noexcept {
  const void* found = ::memmem(bytes.data(), std::min(bytes.size(), kFarBytes), needle.data(), kAnchorBytes);
  if (found == nullptr) return std::nullopt;
  return static_cast<std::size_t>(static_cast<const std::uint8_t*>(found) - bytes.data());
}

struct Gap {
  std::size_t dropped;
  std::size_t added;
};

// How much of each side to skip until they agree again: all of both where they do not. Looks first for what has kept its length,
// as most of what is overwritten has, then for what came or went, as entries do, and then for what did both.
Gap FindGap(ByteView old, ByteView next) noexcept {
  if (old.size() >= kAnchorBytes && next.size() >= kAnchorBytes) {
    const std::size_t oldRange = std::min(kNearBytes, old.size() - kAnchorBytes);
    const std::size_t nextRange = std::min(kNearBytes, next.size() - kAnchorBytes);
    for (std::size_t both = 1; both <= std::min(oldRange, nextRange); ++both) {
      if (Anchor(old, both) == Anchor(next, both)) return {both, both};
    }
    const std::uint64_t oldStart = Anchor(old, 0), nextStart = Anchor(next, 0);
    for (std::size_t added = 1; added <= nextRange; ++added) {
      if (Anchor(next, added) == oldStart) return {0, added};
    }
    for (std::size_t dropped = 1; dropped <= oldRange; ++dropped) {
      if (Anchor(old, dropped) == nextStart) return {dropped, 0};
    }
    for (std::size_t sum = 1; sum <= oldRange + nextRange; ++sum) {
      for (std::size_t dropped = sum > nextRange ? sum - nextRange : 0; dropped <= std::min(sum, oldRange); ++dropped) {
        if (Anchor(old, dropped) == Anchor(next, sum - dropped)) return {dropped, sum - dropped};
      }
    }
    if (const auto added = FindAnchor(next, old)) return {0, *added};
    if (const auto dropped = FindAnchor(old, next)) return {*dropped, 0};
  }
  return {old.size(), next.size()};
}

void AppendStep(Bytes& delta, std::size_t kept, const Gap& gap, ByteView next) {
  std::uint8_t head[3 * kMaxVariableLengthUint64Bytes];
  std::uint8_t* p = SerialiseVariableLengthUint64(head, kept);
  p = SerialiseVariableLengthUint64(p, gap.dropped);
  p = SerialiseVariableLengthUint64(p, gap.added);
  delta.insert(delta.end(), head, p);
  delta.insert(delta.end(), next.begin(), next.begin() + static_cast<std::ptrdiff_t>(gap.added));
}

}  // namespace

std::optional<Bytes> RecordDelta(ByteView old, ByteView next, std::size_t mostBytes) {
  Bytes delta;
  delta.reserve(std::min(mostBytes, kUsualBytes));
  for (;;) {
    const std::size_t kept = CommonPrefix(old, next);
    old = old.subspan(kept);
    next = next.subspan(kept);
    if (old.empty() && next.empty()) return delta;
    const Gap gap = FindGap(old, next);
    if (delta.size() + gap.added > mostBytes) return std::nullopt;
    AppendStep(delta, kept, gap, next);
    if (delta.size() > mostBytes) return std::nullopt;
    old = old.subspan(gap.dropped);
    next = next.subspan(gap.added);
  }
}

Bytes ApplyRecordDelta(ByteView old, ByteView delta) {
  Bytes next;
  next.reserve(old.size() + delta.size());
  BoundedReader reader(delta);
  const auto take = [&](ByteView& from, std::uint64_t count) {
    if (count > from.size()) reader.Fail("a step goes beyond the end of the old version");
    const ByteView taken = from.first(count);
    from = from.subspan(count);
    return taken;
  };
  const auto append = [&](ByteView bytes) { next.insert(next.end(), bytes.begin(), bytes.end()); };
  while (reader.remaining() > 0) {
    append(take(old, reader.ReadUint64()));
    const std::uint64_t dropped = reader.ReadUint64();
    take(old, dropped);
    const std::uint64_t added = reader.ReadUint64();
    if (dropped == 0 && added == 0) reader.Fail("a step changes nothing");
    if (added > reader.remaining()) reader.Fail("a step adds more than there is");
    append(delta.subspan(reader.offset(), added));
    reader.Skip(added);
  }
  append(old);
  return next;
}

}  // namespace vemo
