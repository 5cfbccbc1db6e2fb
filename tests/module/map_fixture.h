// A map adopted by a recording host, with trees given as text.
#pragma once

#include <gtest/gtest.h>

#include <string>

#include "tests/support/assertion_death.h"
#include "tests/support/recording_host.h"
#include "tests/support/tree_checker.h"
#include "tests/support/tree_text.h"

namespace vemo::test {

template <class MapType>
class MapFixture : public ::testing::Test {
 protected:
  using Map = MapType;
  using LeafNode = typename Map::LeafNode;
  using InternalNode = typename Map::InternalNode;
  using Payload = typename Map::Payload;

  MapFixture() : map(*m_hosted) { GTEST_FLAG_SET(death_test_style, "fast"); }
  ~MapFixture() override { EXPECT_EQ(host.Faults(), ""); }

  // Makes the map that tree, clean, with an empty log.
  void Build(const std::string& tree, KeyMaker key = Key) {
    TreeBuilder<Map>::Build(map, tree, key);
    host.CleanAll();
    host.log().Clear();
  }

  // The lifecycle calls since the last time they were asked for.
  std::string Calls() {
    const std::string text = host.log().LifecycleText();
    host.log().Clear();
    return text;
  }

  std::string Tree() const { return TreeText(map); }
  std::string TreeFaults() const { return CheckTree(map); }
  LeafNode* Leaf(int i) const { return host.template Find<LeafNode>("leaf" + std::to_string(i)); }
  InternalNode* Node(int i) const { return host.template Find<InternalNode>("node" + std::to_string(i)); }

  static Payload MakePayload(std::uint64_t n) { return PayloadNumber<Payload>::Make(n); }
  static std::uint64_t PayloadOf(const Payload& payload) { return PayloadNumber<Payload>::Number(payload); }

  RecordingHost host;

 private:
  Hosted<Map> m_hosted{host};

 protected:
  Map& map;
};

}  // namespace vemo::test
