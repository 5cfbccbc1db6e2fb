// Trees as one line of text, read and written.
//
//   -                              no node at all
//   [1 2 3]                        a leaf with the keys 1, 2, 3
//   ([1 2] 3 [3 4 5])              a root with the separator 3 between two leaves
//   (([1..50] 60 [60..99]) 200 ([200..260] 300 [300..350]))
//
// Two dots stand for consecutive numbers; the writer uses them for five or more.
#pragma once

#include <cctype>
#include <cstdint>
#include <new>
#include <stdexcept>
#include <string>
#include <string_view>

#include "platform/types.h"
#include "tests/support/keys.h"
#include "tests/support/test_payload.h"
#include "vxPersistStore/pref.h"

namespace vemo::test {

// Makes a tree node by node, whatever its fill, without an operation of the map. Nodes are registered as they
// open in the text, so that the host calls the root node1 and the leaves leaf1, leaf2 ... from the left.
template <class Map>
class TreeBuilder {
 public:
  using LeafNode = typename Map::LeafNode;
  using InternalNode = typename Map::InternalNode;
  using Payload = typename Map::Payload;

  // `map` must be as newly made; every payload is the one of its key's number.
  static void Build(Map& map, std::string_view text, KeyMaker key = Key) {
    if (text == "-") return;
    TreeBuilder builder(map, text, key);
    builder.ReadNode(map.m_root, map.m_height);
    if (!builder.m_rest.empty()) builder.Fail();
    map.m_lastLeaf = builder.m_last;
  }

 private:
  TreeBuilder(Map& map, std::string_view text, KeyMaker key)
      : m_map(map), m_text(text), m_rest(text), m_key(key) {}

  [[noreturn]] void Fail() const {
    throw std::invalid_argument("no tree at \"" + std::string(m_rest) + "\" in \"" + std::string(m_text) +
                                '"');
  }
  void SkipBlanks() {
    while (!m_rest.empty() && m_rest.front() == ' ') m_rest.remove_prefix(1);
  }
  bool Accept(std::string_view token) {
    SkipBlanks();
    if (!m_rest.starts_with(token)) return false;
    m_rest.remove_prefix(token.size());
    return true;
  }
  std::uint64_t ReadNumber() {
    SkipBlanks();
    if (m_rest.empty() || std::isdigit(static_cast<unsigned char>(m_rest.front())) == 0) Fail();
    std::uint64_t n = 0;
    for (; !m_rest.empty() && std::isdigit(static_cast<unsigned char>(m_rest.front())) != 0;
         m_rest.remove_prefix(1)) {
      n = n * 10 + static_cast<std::uint64_t>(m_rest.front() - '0');
    }
    return n;
  }

  void ReadNode(cref<void>& reference, ssize_t& height) {
    if (Accept("[")) {
      ReadLeaf(reference);
      height = 0;
    } else if (Accept("(")) {
      ReadInternalNode(reference, height);
    } else {
      Fail();
    }
  }

  void ReadLeaf(cref<void>& reference) {
    LeafNode* leaf = DollarNew(::new LeafNode);
    reference = leaf;
    if (m_last == nullptr) {
      m_map.m_firstLeaf = leaf;
    } else {
      m_last->m_next = leaf;
      leaf->m_prev = m_last;
    }
    m_last = leaf;
    while (!Accept("]")) {
      const std::uint64_t first = ReadNumber();
      const std::uint64_t last = Accept("..") ? ReadNumber() : first;
      for (std::uint64_t n = first; n <= last; ++n) {
        ::new (static_cast<void*>(leaf->m_entrys.Slot(leaf->m_numKeyEntrys)))
            typename LeafNode::KeyEntry(m_key(n), PayloadNumber<Payload>::Make(n));
        ++leaf->m_numKeyEntrys;
        ++m_map.m_size;
      }
    }
  }

  void ReadInternalNode(cref<void>& reference, ssize_t& height) {
    InternalNode* node = DollarNew(::new InternalNode);
    reference = node;
    ssize_t below = 0;
    ReadNode(node->m_ptr, below);
    while (!Accept(")")) {
      ::new (static_cast<void*>(node->m_entrys.Slot(node->m_numKeyEntrys))) typename InternalNode::KeyEntry;
      auto& entry = node->GetEntry(node->m_numKeyEntrys++);
      entry.m_key = m_key(ReadNumber());
      ReadNode(entry.m_ptr, below);
    }
    height = below + 1;
  }

  Map& m_map;
  std::string_view m_text;
  std::string_view m_rest;
  KeyMaker m_key;
  LeafNode* m_last = nullptr;
};

template <class Map>
std::string NodeText(ssize_t height, const prefbase& reference) {
  const void* node = reference.Get().m_self;
  std::string text;
  if (height > 0) {
    const auto* internal = static_cast<const typename Map::InternalNode*>(node);
    text = "(" + NodeText<Map>(height - 1, internal->m_ptr);
    for (ssize_t i = 0; i < internal->m_numKeyEntrys; ++i) {
      text += " " + std::to_string(NumberOf(internal->GetEntry(i).m_key)) + " ";
      text += NodeText<Map>(height - 1, internal->GetEntry(i).m_ptr);
    }
    return text + ")";
  }
  const auto* leaf = static_cast<const typename Map::LeafNode*>(node);
  for (ssize_t i = 0; i < leaf->m_numKeyEntrys;) {
    const std::uint64_t first = NumberOf(leaf->GetEntry(i).first);
    ssize_t run = 1;
    while (i + run < leaf->m_numKeyEntrys &&
           NumberOf(leaf->GetEntry(i + run).first) == first + static_cast<std::uint64_t>(run)) {
      ++run;
    }
    if (run < 5) run = 1;
    text += (text.empty() ? "" : " ") + std::to_string(first);
    if (run > 1) text += ".." + std::to_string(first + static_cast<std::uint64_t>(run) - 1);
    i += run;
  }
  return "[" + text + "]";
}

// The tree of `map`; keys are shown by the number of their object alone.
template <class Map>
std::string TreeText(const Map& map) {
  return map.m_height < 0 ? "-" : NodeText<Map>(map.m_height, map.m_root);
}

}  // namespace vemo::test
