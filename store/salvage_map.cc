#include "store/salvage_map.h"

#include <algorithm>
#include <utility>

namespace vemo {

namespace {

using Key = std::optional<FieldId>;

bool IsBelow(const FieldId& key, const Key& high) { return !high || key < *high; }
bool IsAtLeast(const FieldId& key, const Key& low) { return !low || !(key < *low); }

const FieldId& FirstKey(const SoundRecord& leaf) { return leaf.body.leafEntries.front().key; }
const FieldId& LastKey(const SoundRecord& leaf) { return leaf.body.leafEntries.back().key; }
bool IsEmpty(const SoundRecord& leaf) { return leaf.body.leafEntries.empty(); }

// Whether two chains cannot be of one tree: they have keys in a common range, or both an end of the tree.
bool AreOfTwoTrees(const LeafChain& a, const LeafChain& b) {
  const bool overlap = a.first && b.first && !(*a.last < *b.first) && !(*b.last < *a.first);
  return overlap || (a.hasFirstLeaf && b.hasFirstLeaf) || (a.hasLastLeaf && b.hasLastLeaf);
}

}  // namespace

void SalvageMapWalk::SaveTree(const std::string& root, OID oid, RawFamily family, const RawBody& map) {
  m_root = root;
  m_map = oid;
  m_family = family;
  m_nextLeaf = map.firstLeaf;
  m_lastKey.reset();
  m_openGap.reset();
  if (map.levels == 0) return;
  Walk(map.root, map.levels - 1, std::nullopt, std::nullopt);
  CloseGap(map.lastLeaf);
}

void SalvageMapWalk::Walk(OID oid, std::uint32_t height, const Key& low, const Key& high) {
  if (height == 0) {
    std::string fault;
    const std::optional<SoundRecord> leaf = ClaimLeaf(oid, &fault);
    if (!leaf) {
      Lose(oid, low, high, fault);
      m_nextLeaf = m_source.LeafAfter(oid);
      return;
    }
    CloseGap(leaf->body.previous);
    Copy(*leaf);
    m_nextLeaf = leaf->body.next;
    return;
  }
  std::string fault = "it hangs in the trees twice";
  std::optional<SoundRecord> node;
  if (m_claimed.Insert(oid)) node = m_source.ReadAs(oid, {m_family, RawKind::kInternalNode}, &fault);
  if (!node) {
    Lose(oid, low, high, fault + " (what can be reached below it is not lost)");
    WalkHole(low, high);
    return;
  }
  const std::vector<FieldId>& keys = node->body.keys;
  for (std::size_t i = 0; i < node->body.children.size(); ++i) {
    Walk(node->body.children[i], height - 1, i == 0 ? low : Key(keys[i - 1]), i == keys.size() ? high : Key(keys[i]));
  }
}

// Along the chain from the left side; what is not reached so is tried from the right side once there is a leaf.
void SalvageMapWalk::WalkHole(const Key& low, const Key& high) {
  if (m_openGap) {
    m_openGap->high = high;  // two holes side by side are one
    return;
  }
  if (FollowRight(high)) return;
  m_openGap = Gap{m_root, m_map, m_family, m_lastKey ? m_lastKey : low, high};
}

// Copies leaves from m_nextLeaf on while their keys are below `high`. True when nothing is left between.
bool SalvageMapWalk::FollowRight(const Key& high) {
  while (!m_nextLeaf.IsNull()) {
    const OID oid = m_nextLeaf;
    std::string fault;
    const std::optional<SoundRecord> leaf = m_source.ReadAs(oid, {m_family, RawKind::kLeaf}, &fault);
    if (!leaf) {
      Lose(oid, m_lastKey, std::nullopt, fault);
      m_nextLeaf = m_source.LeafAfter(oid);
      if (m_nextLeaf.IsNull()) return false;
      continue;
    }
    if (!IsEmpty(*leaf) && !IsBelow(FirstKey(*leaf), high)) return true;
    if (!m_claimed.Insert(oid)) return false;
    Copy(*leaf);
    m_nextLeaf = leaf->body.next;
    if (m_nextLeaf.IsNull() && !high) return true;
  }
  return false;
}

// Copies leaves from `from` back while their keys are at least `low`.
void SalvageMapWalk::FollowLeft(OID from, const Key& low) {
  for (OID oid = from; !oid.IsNull();) {
    std::string fault;
    const std::optional<SoundRecord> leaf = m_source.ReadAs(oid, {m_family, RawKind::kLeaf}, &fault);
    if (!leaf) {
      Lose(oid, low, std::nullopt, fault);
      oid = m_source.LeafBefore(oid);
      continue;
    }
    if ((!IsEmpty(*leaf) && !IsAtLeast(LastKey(*leaf), low)) || !m_claimed.Insert(oid)) return;
    Copy(*leaf);
    oid = leaf->body.previous;
  }
}

void SalvageMapWalk::CloseGap(OID rightNeighbour) {
  if (!m_openGap) return;
  const Gap gap = *std::exchange(m_openGap, std::nullopt);
  FollowLeft(rightNeighbour, gap.low);
  m_gaps.push_back(gap);
}

std::optional<SoundRecord> SalvageMapWalk::ClaimLeaf(OID oid, std::string* fault) {
  std::optional<SoundRecord> leaf = m_source.ReadAs(oid, {m_family, RawKind::kLeaf}, fault);
  if (leaf && !m_claimed.Insert(oid)) {
    if (fault != nullptr) *fault = "it hangs in the trees twice";
    return std::nullopt;
  }
  return leaf;
}

void SalvageMapWalk::Copy(const SoundRecord& leaf) {
  for (const RawEntry& entry : leaf.body.leafEntries) m_sink.Put(entry);
  if (!IsEmpty(leaf) && (!m_lastKey || *m_lastKey < LastKey(leaf))) m_lastKey = LastKey(leaf);
  ++m_leaves;
  if (m_progress) m_progress(m_leaves, m_source.NumLeaves());
}

void SalvageMapWalk::Lose(OID oid, const Key& low, const Key& high, const std::string& what) {
  if (m_listed.Insert(oid)) m_report.losses.push_back({m_root, oid, low, high, what});
}

// --- Leaves that no tree led to ---

std::vector<LeafChain> SalvageMapWalk::FindChains() const {
  std::vector<LeafChain> chains;
  IdSet seen;
  for (const OID head : m_source.heads()) {
    LeafChain chain;
    chain.head = head;
    bool isFirst = true;
    for (OID oid = head; !oid.IsNull() && !m_claimed.Contains(oid) && seen.Insert(oid);) {
      const std::optional<SoundRecord> leaf = m_source.Read(oid);
      if (!leaf || leaf->rawClass.kind != RawKind::kLeaf) break;
      if (isFirst) {
        chain.family = leaf->rawClass.family;
        chain.hasFirstLeaf = leaf->body.previous.IsNull();
      }
      if (leaf->rawClass.family != chain.family) break;
      isFirst = false;
      chain.commit = std::max(chain.commit, leaf->commit);
      if (!IsEmpty(*leaf)) {
        if (!chain.first) chain.first = FirstKey(*leaf);
        chain.last = LastKey(*leaf);
      }
      chain.tail = oid;
      oid = leaf->body.next;
      chain.hasLastLeaf = oid.IsNull();
    }
    if (!isFirst) chains.push_back(std::move(chain));
  }
  std::stable_sort(chains.begin(), chains.end(), [](const auto& a, const auto& b) { return a.commit > b.commit; });
  return chains;
}

void SalvageMapWalk::SaveChains(const std::string& root, RawFamily family, const RawBody& remains,
                                std::vector<LeafChain>& chains) {
  std::vector<const LeafChain*> saved;
  const auto isNamed = [&remains](const LeafChain& chain) {
    return (chain.hasFirstLeaf || chain.hasLastLeaf) && (!chain.hasFirstLeaf || chain.head == remains.firstLeaf) &&
           (!chain.hasLastLeaf || chain.tail == remains.lastLeaf);
  };
  const auto canBeBetween = [this](const LeafChain& chain) {
    return !chain.hasFirstLeaf && !chain.hasLastLeaf && m_source.KnowsAllDeletions();
  };
  const auto save = [&](const auto& isWanted) {
    for (LeafChain& chain : chains) {
      const auto isOfAnother = [&chain](const LeafChain* other) { return AreOfTwoTrees(*other, chain); };
      if (chain.isSaved || chain.family != family || !isWanted(chain)) continue;
      if (std::any_of(saved.begin(), saved.end(), isOfAnother)) continue;
      SaveChain(root, chain);
      chain.isSaved = true;
      saved.push_back(&chain);
    }
  };
  save(isNamed);
  if (!saved.empty()) save(canBeBetween);
}

void SalvageMapWalk::SaveChain(const std::string& root, const LeafChain& chain) {
  m_root = root;
  m_family = chain.family;
  m_lastKey.reset();
  OID oid = chain.head;
  while (!oid.IsNull()) {
    std::string fault;
    const std::optional<SoundRecord> leaf = m_source.ReadAs(oid, {m_family, RawKind::kLeaf}, &fault);
    if (!leaf) return Lose(oid, m_lastKey, std::nullopt, fault);
    if (!m_claimed.Insert(oid)) return;
    Copy(*leaf);
    oid = leaf->body.next;
  }
}

std::vector<LeafChain> SalvageMapWalk::FillGaps() {
  std::vector<LeafChain> doubtful;
  for (LeafChain& chain : FindChains()) {
    const auto fits = [&chain](const Gap& gap) {
      return gap.family == chain.family && chain.first && IsAtLeast(*chain.first, gap.low) && IsBelow(*chain.last, gap.high);
    };
    const auto gap = std::find_if(m_gaps.begin(), m_gaps.end(), fits);
    // The ends of a tree with a map are reached from the map, so a chain that has an end is of a tree that was replaced.
    if (gap == m_gaps.end() || chain.hasFirstLeaf || chain.hasLastLeaf) continue;
    if (!m_source.KnowsAllDeletions()) {
      doubtful.push_back(std::move(chain));
      continue;
    }
    m_sink.OpenMap(gap->root, gap->map, gap->family);
    SaveChain(gap->root, chain);
    for (SalvageReport::Map& map : m_report.maps) {
      if (map.root == gap->root) map.entries += m_sink.EntriesOfMap();
    }
    m_report.entries += m_sink.EntriesOfMap();
  }
  return doubtful;
}

}  // namespace vemo
