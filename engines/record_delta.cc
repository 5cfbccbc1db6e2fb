#include "engines/record_delta.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <utility>

#include "platform/error.h"
#include "platform/variable_length.h"
#include "vxUtils/BoundedReader.h"

namespace vemo {

namespace {

// Stretches that agree in so many bytes are taken to be the same.
constexpr std::size_t kAnchorBytes = 8;
// How far from where two versions part they are looked at for a stretch that has kept its length, and how much both together may
// be skipped where they are compared at every pair of places.
constexpr std::size_t kNearBytes = 24;
constexpr std::size_t kNearSumBytes = 12;
// How far the one may have grown or shrunk against the other: by an entry with a short payload, or by much more.
constexpr std::size_t kEntryBytes = 40, kFarBytes = 1024;
// How far from where two versions part a stretch may be that is in both behind others that are not.
constexpr std::size_t kWindowBytes = 256;
// How many bytes must agree where a stretch has moved: less recurs, as the 16 bytes of a site do in each list that names it.
constexpr std::size_t kSureBytes = 24;
// Stretches that are replaced as they are, where nothing has kept its length: what they might share is not worth the search.
constexpr std::size_t kShortBytes = 48;
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

std::size_t CommonSuffix(ByteView a, ByteView b) noexcept {
  const std::size_t most = std::min(a.size(), b.size());
  std::size_t n = 0;
  for (; n + kAnchorBytes <= most; n += kAnchorBytes) {
    const std::uint64_t differ = Anchor(a, a.size() - n - kAnchorBytes) ^ Anchor(b, b.size() - n - kAnchorBytes);
    if (differ != 0) return n + static_cast<std::size_t>(std::countl_zero(differ)) / 8;
  }
  while (n < most && a[a.size() - n - 1] == b[b.size() - n - 1]) ++n;
  return n;
}

bool BeginAlike(ByteView a, ByteView b) noexcept { return CommonPrefix(a, b) >= std::min({kSureBytes, a.size(), b.size()}); }

// From where on, not behind `most`, `bytes` goes on as `stretch` does; both have at least kAnchorBytes.
std::optional<std::size_t> FindStretch(ByteView bytes, ByteView stretch, std::size_t most) noexcept {
  const std::uint64_t wanted = Anchor(stretch, 0);
  for (std::size_t at = 0; at <= std::min(most, bytes.size() - kAnchorBytes); ++at) {
    if (Anchor(bytes, at) == wanted && BeginAlike(bytes.subspan(at), stretch)) return at;
  }
  return std::nullopt;
}

struct Gap {
  std::size_t dropped;
  std::size_t added;
};

// What came or went alone, up to `most` bytes; both have at least kAnchorBytes.
std::optional<Gap> FindMove(ByteView old, ByteView next, std::size_t most) noexcept {
  const auto added = FindStretch(next, old, most), dropped = FindStretch(old, next, added.value_or(most));
  if (dropped) return Gap{*dropped, 0};
  if (added) return Gap{0, *added};
  return std::nullopt;
}

// The shortest of a few bytes; both have at least kAnchorBytes.
std::optional<Gap> FindNearGap(ByteView old, ByteView next) noexcept {
  const std::size_t oldRange = old.size() - kAnchorBytes, nextRange = next.size() - kAnchorBytes;
  for (std::size_t sum = 1; sum <= std::min(kNearSumBytes, oldRange + nextRange); ++sum) {
    for (std::size_t dropped = sum > nextRange ? sum - nextRange : 0; dropped <= std::min(sum, oldRange); ++dropped) {
      const std::size_t added = sum - dropped;
      if (Anchor(old, dropped) != Anchor(next, added)) continue;
      if (BeginAlike(old.subspan(dropped), next.subspan(added))) return Gap{dropped, added};
    }
  }
  return std::nullopt;
}

// Both have at least kAnchorBytes.
std::optional<Gap> FindSharedStretch(ByteView old, ByteView next) noexcept {
  constexpr int kSlotBits = 9;
  std::array<std::uint16_t, std::size_t{1} << kSlotBits> places{};  // of anchors in `old`, counted from 1, by their hash
  const auto place = [&](std::uint64_t anchor) -> std::uint16_t& {
    return places[anchor * 0x9E3779B97F4A7C15 >> (64 - kSlotBits)];  // Knuth's multiplicative hashing, by the golden ratio
  };
  const auto range = [](ByteView bytes) { return std::min(kWindowBytes, bytes.size() - kAnchorBytes + 1); };
  for (std::size_t i = range(old); i > 0; --i) place(Anchor(old, i - 1)) = static_cast<std::uint16_t>(i);
  for (std::size_t added = 0; added < range(next); ++added) {
    const std::size_t found = place(Anchor(next, added));
    if (found != 0 && BeginAlike(old.subspan(found - 1), next.subspan(added))) return Gap{found - 1, added};
  }
  return std::nullopt;
}

// How much of each side to skip until they agree again: all of both where they do not. Looks first for what has kept its length,
// as most of what is overwritten has, then for what came or went, as entries do, then for what has grown or shrunk a little, and
// then further away.
Gap FindGap(ByteView old, ByteView next) noexcept {
  if (old.size() >= kAnchorBytes && next.size() >= kAnchorBytes) {
    const std::size_t near = std::min({kNearBytes, old.size() - kAnchorBytes, next.size() - kAnchorBytes});
    for (std::size_t both = 1; both <= near; ++both) {
      if (Anchor(old, both) == Anchor(next, both)) return {both, both};
    }
    if (const auto gap = FindMove(old, next, kEntryBytes)) return *gap;
    if (const auto gap = FindNearGap(old, next)) return *gap;
    if (old.size() <= kShortBytes && next.size() <= kShortBytes) return {old.size(), next.size()};
    if (const auto gap = FindMove(old, next, kFarBytes)) return *gap;
    if (const auto gap = FindSharedStretch(old, next)) return *gap;
  }
  return {old.size(), next.size()};
}

class DeltaWriter {
 public:
  explicit DeltaWriter(std::size_t mostBytes) : m_mostBytes(mostBytes) { m_delta.reserve(std::min(mostBytes, kUsualBytes)); }

  void Keep(std::size_t bytes) noexcept { m_kept += bytes; }
  // False where the delta would be too long.
  bool Replace(std::size_t dropped, ByteView added) {
    std::uint8_t head[3 * kMaxVariableLengthUint64Bytes];
    std::uint8_t* p = SerialiseVariableLengthUint64(head, std::exchange(m_kept, 0));
    p = SerialiseVariableLengthUint64(p, dropped);
    p = SerialiseVariableLengthUint64(p, added.size());
    if (m_delta.size() + static_cast<std::size_t>(p - head) + added.size() > m_mostBytes) return false;
    m_delta.insert(m_delta.end(), head, p);
    m_delta.insert(m_delta.end(), added.begin(), added.end());
    return true;
  }
  Bytes Take() noexcept { return std::move(m_delta); }

 private:
  std::size_t m_mostBytes;
  std::size_t m_kept = 0;
  Bytes m_delta;
};

// All but the last bytes, which a record has for its checksum: they always differ.
ByteView WithoutChecksum(ByteView record) noexcept {
  constexpr std::size_t kChecksumBytes = 8;
  return record.first(record.size() - std::min(record.size(), kChecksumBytes));
}

// What stands between the parts that both begin and end with.
bool WriteMiddle(ByteView old, ByteView next, DeltaWriter& delta) {
  for (;;) {
    const std::size_t kept = CommonPrefix(old, next);
    delta.Keep(kept);
    old = old.subspan(kept);
    next = next.subspan(kept);
    if (old.empty() && next.empty()) return true;
    const Gap gap = FindGap(old, next);
    if (!delta.Replace(gap.dropped, next.first(gap.added))) return false;
    old = old.subspan(gap.dropped);
    next = next.subspan(gap.added);
  }
}

}  // namespace

std::optional<Bytes> RecordDelta(ByteView old, ByteView next, std::size_t mostBytes) {
  DeltaWriter delta(mostBytes);
  const ByteView oldBody = WithoutChecksum(old), nextBody = WithoutChecksum(next);
  const std::size_t prefix = CommonPrefix(oldBody, nextBody);
  const ByteView oldRest = oldBody.subspan(prefix), nextRest = nextBody.subspan(prefix);
  const std::size_t suffix = CommonSuffix(oldRest, nextRest);
  delta.Keep(prefix);
  if (!WriteMiddle(oldRest.first(oldRest.size() - suffix), nextRest.first(nextRest.size() - suffix), delta)) return std::nullopt;
  delta.Keep(suffix);
  if (!WriteMiddle(old.subspan(oldBody.size()), next.subspan(nextBody.size()), delta)) return std::nullopt;
  return delta.Take();
}

void ApplyRecordDelta(ByteView old, ByteView delta, Bytes& next) {
  next.clear();
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
}

}  // namespace vemo
