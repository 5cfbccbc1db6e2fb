// A field map beside a std::map that is told the same.
#pragma once

#include <cstdint>
#include <iterator>
#include <map>
#include <random>
#include <string>
#include <utility>

#include "tests/support/keys.h"
#include "tests/support/test_payload.h"
#include "tests/support/tree_checker.h"

namespace vemo::test {

// Every operation is done on both, in one of the ways in which the map offers it, and its result compared. A
// difference is text; no difference is the empty string.
template <class Map>
class ModelledMap {
 public:
  using Payload = typename Map::Payload;
  using Model = std::map<FieldId, std::uint64_t>;

  explicit ModelledMap(Map& map) : m_map(map) {}

  const Model& model() const { return m_model; }

  // Inserts `key`, or replaces or keeps its payload, by way `way` (any number).
  std::string Insert(const FieldId& key, std::uint64_t payloadNumber, unsigned way) {
    const Payload payload = PayloadNumber<Payload>::Make(payloadNumber);
    const bool isNew = m_model.count(key) == 0;
    bool created = isNew;
    switch (way % 5) {
      case 0:
        created = m_map.Insert(key, payload, false);
        m_model.emplace(key, payloadNumber);
        break;
      case 1:
        created = m_map.Insert(key, payload, true);
        m_model[key] = payloadNumber;
        break;
      case 2: {
        const auto [position, inserted] = m_map.insert({key, payload});
        created = inserted;
        m_model.emplace(key, payloadNumber);
        if (!(std::as_const(position)->first == key)) return "insert() returned another position";
        break;
      }
      case 3:
        m_map[key] = payload;
        m_model[key] = payloadNumber;
        break;
      default: {
        typename Map::wFindRet found;
        m_map.wFind(found, key, true);
        created = found.m_created;
        *found.m_payload = payload;
        found.m_leaf->MarkAsDirtyWithoutTrace();
        m_model[key] = payloadNumber;
        if (!(found.m_leaf->GetEntry(found.m_index).first == key)) return "wFind() returned another position";
      }
    }
    return created == isNew ? "" : "insertion of " + FieldIdText(key) + " said the wrong thing";
  }

  std::string Delete(const FieldId& key, unsigned way) {
    const auto entry = m_model.find(key);
    const bool present = entry != m_model.end();
    bool deleted = present;
    if (way % 3 == 0) {
      deleted = m_map.Delete(key);
    } else if (way % 3 == 1 || !present) {
      deleted = m_map.erase(key) == 1;
    } else {
      const auto following = m_map.erase(m_map.find(key));
      const auto expected = std::next(entry);
      const bool atEnd = following == m_map.end();
      if (atEnd != (expected == m_model.end()) ||
          (!atEnd && !(following.const_deref().first == expected->first))) {
        return "erase() returned another position";
      }
    }
    if (present) m_model.erase(entry);
    return deleted == present ? "" : "deletion of " + FieldIdText(key) + " said the wrong thing";
  }

  // Walks everything: the tree, the entries in both directions.
  std::string Compare() const {
    m_map.Validate();
    if (const std::string faults = CheckTree(m_map); !faults.empty()) return faults;
    const Map& map = m_map;
    if (map.size() != static_cast<ssize_t>(m_model.size())) return "another size";
    auto j = m_model.begin();
    for (auto i = map.begin(); i != map.end(); ++i, ++j) {
      if (!(i->first == j->first)) return "another key forwards: " + FieldIdText(i->first);
      if (PayloadNumber<Payload>::Number(i->second) != j->second)
        return "another payload at " + FieldIdText(i->first);
    }
    auto k = m_model.rbegin();
    for (auto i = map.rbegin(); i != map.rend(); ++i, ++k) {
      if (!(i->first == k->first)) return "another key backwards: " + FieldIdText(i->first);
    }
    return "";
  }

  // Compares every look-up of one key.
  std::string CompareAt(const FieldId& key) const {
    const Map& map = m_map;
    const auto entry = m_model.find(key);
    const bool present = entry != m_model.end();
    const Payload* const payload = map.rFind(key);
    if ((payload != nullptr) != present || map.contains(key) != present ||
        map.count(key) != (present ? 1 : 0)) {
      return "presence of " + FieldIdText(key);
    }
    if (present && PayloadNumber<Payload>::Number(*payload) != entry->second)
      return "payload of " + FieldIdText(key);
    if (!IsAt(map.find(key), entry)) return "find of " + FieldIdText(key);
    if (!IsAt(map.lower_bound(key), m_model.lower_bound(key))) return "lower bound of " + FieldIdText(key);
    if (!IsAt(map.upper_bound(key), m_model.upper_bound(key))) return "upper bound of " + FieldIdText(key);
    return "";
  }

 private:
  bool IsAt(typename Map::const_iterator i, Model::const_iterator expected) const {
    if (expected == m_model.end()) return i == m_map.cend();
    return i != m_map.cend() && i->first == expected->first;
  }

  Map& m_map;
  Model m_model;
};

enum class Order { kAscending, kDescending, kRandom, kClustered };

// Chooses keys of a random run. Numbers run from 1 to `range`.
class KeyChooser {
 public:
  KeyChooser(std::mt19937_64& random, std::uint64_t range) : m_random(random), m_range(range) {}

  // Ascending and descending walk in small steps and start over at the end; clustered stays near one place
  // for a while.
  std::uint64_t Next(Order order) {
    switch (order) {
      case Order::kAscending:
        m_last = m_last + Draw(3);
        break;
      case Order::kDescending:
        m_last = m_last + 3 * m_range - Draw(3);
        break;
      case Order::kRandom:
        m_last = Draw(m_range);
        break;
      case Order::kClustered:
        m_last = Draw(24) == 1 ? Draw(m_range) : m_last + m_range + Draw(9) - 5;
        break;
    }
    m_last = (m_last - 1) % m_range + 1;
    return m_last;
  }

  // 1 .. n
  std::uint64_t Draw(std::uint64_t n) { return m_random() % n + 1; }

 private:
  std::mt19937_64& m_random;
  std::uint64_t m_range;
  std::uint64_t m_last = 1;
};

}  // namespace vemo::test
