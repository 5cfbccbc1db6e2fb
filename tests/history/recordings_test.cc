// The recorded sessions, where they are at hand: next to the source folder or in VEMO_DATA_DIR.
#include <gtest/gtest.h>

#include "edit_model.h"
#include "history/edit_source.h"
#include "recordings.h"

namespace vemo::test {
namespace {

struct Sizes {
  const char* name;
  std::size_t inserted;
  std::size_t deleted;
  std::size_t final;
};

// Counts the elements besides.
class CountingModel : public EditModel {
 public:
  void OnEdit(const Edit& edit) override {
    inserted += edit.inserted.size();
    deleted += static_cast<std::size_t>(edit.deleted);
    EditModel::OnEdit(edit);
  }
  std::size_t inserted = 0;
  std::size_t deleted = 0;
};

class Recordings : public ::testing::TestWithParam<Sizes> {};

TEST_P(Recordings, EndAsRecorded) {
  const std::filesystem::path file = DataFolder() / GetParam().name;
  if (!std::filesystem::exists(file))
    GTEST_SKIP() << file << " is not there; VEMO_DATA_DIR can name its folder";
  const FieldId field = ParseFieldId("1:0");
  const auto source = OpenTrace(file, field, "writer");
  CountingModel model;
  source->Replay(model);
  EXPECT_EQ(source->CountEdits(), model.edits);
  EXPECT_EQ(model.inserted, GetParam().inserted);
  EXPECT_EQ(model.deleted, GetParam().deleted);
  EXPECT_EQ(model.fields[field].size(), GetParam().final);
  source->ForEachFinalContent([&](const FinalContent& content) {
    EXPECT_TRUE(model.fields[field].Joined() == content.bytes) << "the final texts differ";
  });
}

INSTANTIATE_TEST_SUITE_P(Sequential, Recordings,
                         ::testing::Values(Sizes{"automerge-paper.json.gz", 182315, 77463, 104852},
                                           Sizes{"sveltecomponent.json.gz", 93984, 75533, 18451},
                                           Sizes{"json-crdt-blog-post.json.gz", 41470, 9960, 31510}),
                         [](const auto& tested) {
                           std::string name = tested.param.name;
                           name.resize(name.find('.'));
                           std::erase(name, '-');
                           return name;
                         });

TEST(ConcurrentRecordings, AreRefused) {
  const std::filesystem::path file = DataFolder() / "friendsforever.json.gz";
  if (!std::filesystem::exists(file))
    GTEST_SKIP() << file << " is not there; VEMO_DATA_DIR can name its folder";
  EXPECT_EQ(SourceErrorOf([&] { OpenTrace(file, ParseFieldId("1:0"), "writer"); }),
            file.string() +
                ": this is a recording of concurrent authors; only those of one author can be replayed");
}

}  // namespace
}  // namespace vemo::test
