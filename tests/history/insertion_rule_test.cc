// Where an insertion among tombstones goes decides how many runs of tombstones a session leaves.
#include <gtest/gtest.h>

#include <iostream>
#include <string>

#include "history/edit_source.h"
#include "recordings.h"
#include "vxOT/TPToQMap.h"

namespace vemo::test {
namespace {

// Applies edits by the recorder's rule and by its mirror.
class BothRules : public EditVisitor {
 public:
  void OnSite(const Guid&, std::string_view) override {}
  void OnObject(OID, std::string_view) override {}
  void OnCommit(const Commit&) override {}
  void OnEdit(const Edit& edit) override {
    const auto inserted = static_cast<ssize_t>(edit.inserted.size());
    if (edit.deleted > 0) {
      behindTheElementBefore.Erasep(edit.position, edit.deleted);
      beforeTheElementBehind.Erasep(edit.position, edit.deleted);
    } else {
      behindTheElementBefore.Insert(edit.position == 0 ? 0 : behindTheElementBefore.GetQ(edit.position - 1) + 1, inserted);
      beforeTheElementBehind.Insert(edit.position == m_live ? m_length : beforeTheElementBehind.GetQ(edit.position), inserted);
    }
    m_live += inserted - edit.deleted;
    m_length += inserted;
  }

  VectorTombstones behindTheElementBefore;
  VectorTombstones beforeTheElementBehind;

 private:
  ssize_t m_live = 0;
  ssize_t m_length = 0;
};

class InsertionRule : public testing::TestWithParam<const char*> {};

TEST_P(InsertionRule, GoingInFrontOfTombstonesLeavesFewerRunsThanGoingBehindThem) {
  const std::filesystem::path recording = DataFolder() / (std::string(GetParam()) + ".json.gz");
  if (!std::filesystem::exists(recording)) {
    GTEST_SKIP() << recording << " is not there; VEMO_DATA_DIR can name its folder";
  }
  BothRules rules;
  OpenTrace(recording, FieldId{OID(1), Path{0}}, "author")->Replay(rules);
  const ssize_t runs = rules.behindTheElementBefore.m_tombstones.size();
  const ssize_t mirrored = rules.beforeTheElementBehind.m_tombstones.size();
  std::cout << GetParam() << ": " << runs << " against " << mirrored << '\n';
  EXPECT_EQ(rules.behindTheElementBefore.NumTombstones(), rules.beforeTheElementBehind.NumTombstones());
  EXPECT_LT(runs, mirrored);
}

INSTANTIATE_TEST_SUITE_P(Recordings, InsertionRule,
                         testing::Values("automerge-paper", "sveltecomponent", "json-crdt-blog-post"),
                         [](const auto& recording) {
                           std::string name = recording.param;
                           std::erase(name, '-');
                           return name;
                         });

}  // namespace
}  // namespace vemo::test
