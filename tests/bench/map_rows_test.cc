// Every row of the maps in memory does its work, and all peers of a row the same.
#include "bench/maps/map_row.h"

#include <gtest/gtest.h>

#include <map>
#include <set>

namespace vemo::bench {
namespace {

// More than one leaf of any peer, and no multiple of anything.
constexpr std::size_t kSize = 1'237;

TEST(MapRows, AllPeersOfARowGiveTheSameAnswers) {
  std::map<std::string, std::uint64_t> answers;
  for (const MapRow& row : AllMapRows()) {
    SCOPED_TRACE(row.name + " of " + row.peer);
    const Measurement measurement = row.run(kSize);
    const auto [known, isFirst] = answers.emplace(row.name, measurement.answers);
    EXPECT_EQ(known->second, measurement.answers) << "differs from the peer before";
    EXPECT_NE(measurement.answers, 0U);
  }
}

TEST(MapRows, EveryRowIsMeasuredForVemoAndTheStandardMap) {
  std::map<std::string, std::set<std::string>> peers;
  for (const MapRow& row : AllMapRows()) {
    EXPECT_TRUE(peers[row.name].insert(row.peer).second) << row.name << " twice for " << row.peer;
  }
  EXPECT_GE(peers.size(), 40U);
  for (const auto& [name, measured] : peers) {
    EXPECT_TRUE(measured.count("vemo") == 1 && measured.count("std::map") == 1) << name;
  }
}

std::uint64_t AnswersOfVemo(const std::string& name) {
  for (const MapRow& row : AllMapRows()) {
    if (row.peer == "vemo" && row.name == name) return row.run(kSize).answers;
  }
  ADD_FAILURE() << "there is no row " << name;
  return 0;
}

TEST(MapRows, LookUpsFindWhatTheyAreMeantToFind) {
  EXPECT_EQ(AnswersOfVemo("map.insert.random.P2"), kSize);
  EXPECT_EQ(AnswersOfVemo("map.find-hit.clustered.P1"), 2 * kSize);  // each payload has two runs
  EXPECT_EQ(AnswersOfVemo("map.find-miss.clustered.P1"), kSize);
  EXPECT_EQ(AnswersOfVemo("map.find-dependent.random.P2"), kSize);
  EXPECT_EQ(AnswersOfVemo("map.erase.random.P1"), kSize);
}

TEST(MapRows, TheSameRowGivesTheSameAnswersAgain) {
  for (const char* name : {"map.scan.random.P2", "map.mixed.clustered.P1"})
    EXPECT_EQ(AnswersOfVemo(name), AnswersOfVemo(name)) << name;
}

}  // namespace
}  // namespace vemo::bench
