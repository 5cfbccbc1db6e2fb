// What is done to a map, written once for all peers.
//
// A Peer is a class with
//   using Payload
//   static constexpr bool kGrows             whether it inserts, erases and copies at a sensible cost
//   Peer(keys, payloads)                     an empty map if kGrows, else a filled one
//   bool Insert(key, payload); bool Erase(key)
//   const Payload* Find(key)                 null where there is none
//   const FieldId* LowerBound(key)           null behind the last key
//   std::uint64_t Scan(visit)                visit(payload) in ascending order
//   auto Copy()                              an owner of a copy
#pragma once

#include <algorithm>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "bench/common/entries.h"
#include "bench/common/measure.h"
#include "bench/maps/map_row.h"

namespace vemo::bench {

template <class Peer>
class MapWorkload {
 public:
  using Payload = typename Peer::Payload;
  using Kind = PayloadKind<Payload>;
  using Body = std::uint64_t (MapWorkload::*)();

  MapWorkload(KeyKind kind, std::size_t size) : m_kind(kind), m_size(size), m_keys(MakeKeys(kind, size)) {}

  // Runs `prepare`, then times `body`, which does `operations` operations. The answers are what `body`
  // returns.
  Measurement Run(Body prepare, Body body, std::size_t operations) {
    m_peer.emplace_back(m_keys, m_payloads);
    if (prepare != nullptr) (this->*prepare)();
    auto section = [this, body] { return (this->*body)(); };
    const double start = ProcessorNanoseconds();
    const std::uint64_t answers = MeasuredSection(section);
    const double end = ProcessorNanoseconds();
    return {"", "ns/op", (end - start) / static_cast<double>(operations), answers};
  }

  // How much more memory there is in use when all entries are in.
  Measurement RunMemory() {
    const std::uint64_t before = AllocatedBytes();
    m_peer.emplace_back(m_keys, m_payloads);
    if constexpr (Peer::kGrows) Insert();
    const std::uint64_t after = AllocatedBytes();
    return {"", "bytes/entry", static_cast<double>(after - before) / static_cast<double>(m_size), m_size};
  }

  std::size_t Size() const { return m_size; }

  // --- Preparations; each returns nothing of interest. ---

  std::uint64_t Fill() {
    if constexpr (Peer::kGrows) Insert();
    m_order = MakeOrder(m_size, 1);
    m_probes.reserve(m_size);
    for (const std::uint32_t i : m_order) m_probes.push_back(m_keys[i]);
    return 0;
  }
  std::uint64_t FillAndMiss() {
    Fill();
    m_probes = MakeMissingKeys(m_kind, m_size);
    return 0;
  }
  // Half of the probes are there, half are not.
  std::uint64_t FillAndMissHalf() {
    FillAndMiss();
    for (std::size_t i = 0; i < m_size; i += 2) m_probes[i] = m_keys[m_order[i]];
    return 0;
  }
  std::uint64_t FillAndSpare() {
    Fill();
    m_spares = MakeMissingKeys(m_kind, m_size);
    return 0;
  }

  // --- What is measured ---

  std::uint64_t Insert() {
    std::uint64_t made = 0;
    for (std::size_t i = 0; i < m_size; ++i) made += m_peer[0].Insert(m_keys[i], m_payloads[i]);
    return made;
  }
  std::uint64_t Find() {
    std::uint64_t sum = 0;
    for (const FieldId& key : m_probes) {
      const Payload* payload = m_peer[0].Find(key);
      sum += payload != nullptr ? Kind::Touch(*payload) : 1;
    }
    return sum;
  }
  // The next key is known only when the payload of the last one has been read.
  std::uint64_t FindDependent() {
    std::size_t next = 0;
    for (std::size_t i = 0; i < m_size; ++i)
      next += 1 + static_cast<std::size_t>(Kind::Touch(*m_peer[0].Find(m_probes[next])) - Kind::kTouched);
    return next;
  }
  std::uint64_t LowerBound() {
    std::uint64_t sum = 0;
    for (const FieldId& key : m_probes) {
      const FieldId* found = m_peer[0].LowerBound(key);
      sum += found != nullptr ? found->oid.m_value : 1;
    }
    return sum;
  }
  std::uint64_t Scan() {
    std::uint64_t sum = 0;
    m_peer[0].Scan([&sum](const Payload& payload) { sum = sum * 31 + Kind::Read(payload); });
    return sum;
  }
  std::uint64_t Erase() {
    std::uint64_t erased = 0;
    for (const FieldId& key : m_probes) erased += m_peer[0].Erase(key);
    return erased;
  }
  // Of ten operations eight look up, one inserts and one erases.
  std::uint64_t Mixed() {
    std::uint64_t sum = 0;
    for (std::size_t i = 0; i < m_size; ++i) {
      if (i % 10 == 3) {
        sum += m_peer[0].Insert(m_spares[i], m_payloads[i]);
      } else if (i % 10 == 8) {
        sum += m_peer[0].Erase(m_probes[i]);
      } else {
        sum += m_peer[0].Find(m_probes[m_size - 1 - i]) != nullptr;
      }
    }
    return sum;
  }
  std::uint64_t Copy() {
    m_copy = m_peer[0].Copy();
    return m_size;
  }

 private:
  KeyKind m_kind;
  std::size_t m_size;
  std::vector<FieldId> m_keys;
  std::vector<FieldId> m_probes;
  std::vector<FieldId> m_spares;
  std::vector<std::uint32_t> m_order;
  PayloadPool<Payload> m_payloads;
  std::vector<Peer> m_peer;  // none or one
  std::invoke_result_t<decltype(&Peer::Copy), Peer&> m_copy{};
};

// Adds the rows of one peer with one kind of keys.
template <class Peer>
void AddMapRows(std::vector<MapRow>& rows, const std::string& peer, KeyKind kind) {
  using W = MapWorkload<Peer>;
  using Body = typename W::Body;
  const std::string suffix = "." + std::string(KeyKindName(kind)) + "." + std::string(W::Kind::kName);
  const auto add = [&](const char* operation, Body prepare, Body body) {
    rows.push_back({std::string("map.") + operation + suffix, peer, [=](std::size_t size) {
                      W workload(kind, size);
                      return workload.Run(prepare, body, size);
                    }});
  };
  if constexpr (Peer::kGrows) add("insert", nullptr, &W::Insert);
  if (kind != KeyKind::kAscending) {
    add("find-hit", &W::Fill, &W::Find);
    add("find-miss", &W::FillAndMiss, &W::Find);
    add("find-dependent", &W::Fill, &W::FindDependent);
    add("lower-bound", &W::FillAndMissHalf, &W::LowerBound);
    add("scan", &W::Fill, &W::Scan);
    if constexpr (Peer::kGrows) {
      add("erase", &W::Fill, &W::Erase);
      add("mixed", &W::FillAndSpare, &W::Mixed);
      add("copy", &W::Fill, &W::Copy);
    }
  }
  rows.push_back({"map.memory" + suffix, peer, [=](std::size_t size) { return W(kind, size).RunMemory(); }});
}

// Adds the rows of a template over the payload, with every kind of keys.
template <template <class> class Peer>
void AddAllMapRows(std::vector<MapRow>& rows, const std::string& peer) {
  for (const KeyKind kind : {KeyKind::kClustered, KeyKind::kRandom, KeyKind::kAscending}) {
    AddMapRows<Peer<VectorTombstones>>(rows, peer, kind);
    AddMapRows<Peer<VectorInsertions>>(rows, peer, kind);
  }
}

}  // namespace vemo::bench
