#include "history/blame.h"

#include <gtest/gtest.h>

#include <random>

#include "platform/error.h"
#include "recorded_fields.h"
#include "tests/support/seed.h"

namespace vemo::test {
namespace {

// Runs as "A0-4@2/10": the numbers of the elements, the live position of the first and its position among
// all.
std::string RunsText(const std::vector<BlameRun>& runs) {
  std::string text;
  for (const BlameRun& run : runs) {
    if (!text.empty()) text += ' ';
    text += static_cast<char>(run.first.s.Data1);  // as Site makes it
    text += std::to_string(run.first.t);
    if (run.n > 1) text += "-" + std::to_string(run.first.t + run.n - 1);
    text += "@" + std::to_string(run.p) + "/" + std::to_string(run.q);
    if (!run.commit.empty()) text += " of " + run.commit;
  }
  return text;
}

class Blame : public testing::Test {
 protected:
  std::vector<BlameRun> Runs(const FieldId& field) {
    m_recorded.Commit();
    Snapshot snapshot(m_recorded.space());
    return BlameField(snapshot, field);
  }
  std::string Text(const FieldId& field) { return RunsText(Runs(field)); }
  std::string Refusal(const FieldId& field) {
    try {
      Runs(field);
    } catch (const UsageError& error) {
      return error.what();
    }
    return "nothing was thrown";
  }
  void SetMeta(const std::string& name, const std::string& value) {
    m_recorded.transaction().SetMeta(name, value);
  }

  RecordingSpace m_recorded;
};

TEST_F(Blame, OfOneInsertionIsOneRun) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 5);
  EXPECT_EQ(Text(Field(1)), "A0-4@0/0");
}

TEST_F(Blame, JoinsInsertionsThatGoOnWhereTheLastOneEnded) {
  for (ssize_t i = 0; i < 4; ++i) m_recorded.recorder().Insert(Site('A'), Field(1), i, 1);
  EXPECT_EQ(Text(Field(1)), "A0-3@0/0");
}

TEST_F(Blame, ShowsBothHalvesOfARunThatWasSplit) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 6);
  m_recorded.recorder().Insert(Site('B'), Field(1), 4, 2);
  EXPECT_EQ(Text(Field(1)), "A0-3@0/0 B0-1@4/4 A4-5@6/6");
}

TEST_F(Blame, LeavesTombstonesOutAndCountsThemInQ) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 10);
  m_recorded.recorder().Delete(Site('B'), Field(1), 0, 1);
  m_recorded.recorder().Delete(Site('B'), Field(1), 3, 2);
  m_recorded.recorder().Delete(Site('B'), Field(1), 6, 1);
  EXPECT_EQ(Text(Field(1)), "A1-3@0/1 A6-8@3/6");
}

TEST_F(Blame, OfAFieldWithoutLiveElementsIsEmpty) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 3);
  m_recorded.recorder().Delete(Site('A'), Field(1), 0, 3);
  EXPECT_EQ(Text(Field(1)), "");
}

TEST_F(Blame, NamesTheAuthorThatIsRecordedForASite) {
  SetMeta(SiteMetaName(Site('A')), "Ada Lovelace <ada@example.org>");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 1);
  m_recorded.recorder().Insert(Site('B'), Field(1), 1, 1);
  const std::vector<BlameRun> runs = Runs(Field(1));
  ASSERT_EQ(runs.size(), 2u);
  EXPECT_EQ(runs[0].author, "Ada Lovelace <ada@example.org>");
  EXPECT_EQ(runs[1].author, "");
}

TEST_F(Blame, RefusesAFieldThatIsNotRecorded) {
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 1);
  EXPECT_EQ(Refusal(Field(2)), "memory:: field 2:0 is not recorded");
}

TEST_F(Blame, RefusesASpaceWithoutTheMapsOfARecorder) {
  const auto space = CSpace::Open("memory:");
  Snapshot snapshot(*space);
  EXPECT_THROW(BlameField(snapshot, Field(1)), UsageError);
}

// --- Commits ---

TEST_F(Blame, SplitsARunWhereTheCommitChanges) {
  SetMeta(ObjectMetaName(OID(1)), "file");
  SetMeta(CommitMetaName(Site('A'), 0), "c0");
  SetMeta(CommitMetaName(Site('A'), 4), "c4");
  SetMeta(CommitMetaName(Site('A'), 5), "c5");
  SetMeta(CommitMetaName(Site('A'), 300), "c300");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 310);
  EXPECT_EQ(Text(Field(1)), "A0-3@0/0 of c0 A4@4/4 of c4 A5-299@5/5 of c5 A300-309@300/300 of c300");
}

TEST_F(Blame, LooksCommitsUpSiteBySite) {
  SetMeta(ObjectMetaName(OID(1)), "file");
  SetMeta(CommitMetaName(Site('A'), 0), "a0");
  SetMeta(CommitMetaName(Site('A'), 2), "a2");
  SetMeta(CommitMetaName(Site('B'), 0), "b0");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 4);
  m_recorded.recorder().Insert(Site('B'), Field(1), 3, 3);
  EXPECT_EQ(Text(Field(1)), "A0-1@0/0 of a0 A2@2/2 of a2 B0-2@3/3 of b0 A3@6/6 of a2");
}

TEST_F(Blame, HasNoCommitForOperationsFromBeforeTheFirst) {
  SetMeta(ObjectMetaName(OID(1)), "file");
  SetMeta(CommitMetaName(Site('A'), 2), "a2");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 4);
  EXPECT_EQ(Text(Field(1)), "A0-1@0/0 A2-3@2/2 of a2");
}

// The author of a repository may be the author of a recording in the same space.
TEST_F(Blame, HasNoCommitForAFieldThatIsNoGitFile) {
  SetMeta(ObjectMetaName(OID(1)), "file");
  SetMeta(CommitMetaName(Site('A'), 0), "a0");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 2);
  m_recorded.recorder().Insert(Site('A'), Field(1, 7), 0, 2);
  m_recorded.recorder().Insert(Site('A'), Field(9), 0, 2);
  EXPECT_EQ(Text(Field(1)), "A0-1@0/0 of a0");
  EXPECT_EQ(Text(Field(1, 7)), "A2-3@0/0");
  EXPECT_EQ(Text(Field(9)), "A4-5@0/0");
}

TEST_F(Blame, OfAGitFileThatNeverHadALineIsEmpty) {
  SetMeta(ObjectMetaName(OID(3)), "empty");
  EXPECT_EQ(Text(Field(3)), "");
}

TEST_F(Blame, RefusesACommitWhoseNumberIsNone) {
  SetMeta(ObjectMetaName(OID(1)), "file");
  SetMeta("commit/" + GuidText(Site('A')) + "/7", "c");
  m_recorded.recorder().Insert(Site('A'), Field(1), 0, 1);
  EXPECT_EQ(Refusal(Field(1)),
            "meta value \"commit/" + GuidText(Site('A')) + "/7\" should end in 16 hexadecimal digits");
}

TEST_F(Blame, FindsTheFieldOfAPath) {
  SetMeta(ObjectMetaName(OID(1)), "a");
  SetMeta(ObjectMetaName(OID(300)), "b/\xff c");
  m_recorded.Commit();
  const Snapshot snapshot(m_recorded.space());
  EXPECT_EQ(FindGitField(snapshot, "a"), Field(1));
  EXPECT_EQ(FindGitField(snapshot, "b/\xff c"), Field(300));
  EXPECT_EQ(FindGitField(snapshot, "b"), std::nullopt);
}

// --- Against a model ---

struct Element {
  Opid operation;
  bool isLive = true;
};

// Where in `elements` an insertion at live position `p` goes: directly behind the live element before it.
std::size_t PlaceOf(const std::vector<Element>& elements, ssize_t p) {
  std::size_t q = 0;
  for (ssize_t live = 0; live < p; ++q) {
    if (elements[q].isLive) ++live;
  }
  return q;
}

void DeleteLive(std::vector<Element>& elements, ssize_t p, ssize_t n) {
  ssize_t live = 0;
  for (Element& element : elements) {
    if (!element.isLive) continue;
    if (live >= p && live < p + n) element.isLive = false;
    ++live;
  }
}

// The commit of a number: those of the tests begin every 7 numbers.
std::string CommitOf(const Opid& operation) {
  return "c" + std::to_string(operation.t / 7 * 7);
}

std::vector<BlameRun> ExpectedRuns(const std::vector<Element>& elements) {
  std::vector<BlameRun> runs;
  ssize_t p = 0;
  for (std::size_t i = 0; i < elements.size(); ++i) {
    if (!elements[i].isLive) continue;
    const auto q = static_cast<ssize_t>(i);
    const Opid& operation = elements[i].operation;
    BlameRun* last = runs.empty() ? nullptr : &runs.back();
    if (last != nullptr && last->q + last->n == q && last->first.s == operation.s &&
        last->first.t + last->n == operation.t && last->commit == CommitOf(operation)) {
      ++last->n;
    } else {
      runs.push_back({p, q, 1, operation, "", CommitOf(operation)});
    }
    ++p;
  }
  return runs;
}

TEST_F(Blame, OfRandomEditsIsThatOfAListOfElements) {
  std::mt19937_64 random(TestSeed(20261121));
  const auto below = [&](ssize_t n) {
    return static_cast<ssize_t>(random() % static_cast<std::uint64_t>(n));
  };
  SetMeta(ObjectMetaName(OID(1)), "file");
  for (const char site : {'A', 'B', 'C'}) {
    for (ssize_t first = 0; first < 10'000; first += 7) {
      SetMeta(CommitMetaName(Site(site), first), "c" + std::to_string(first));
    }
  }
  std::vector<Element> elements;
  for (int edit = 0; edit < 1'500; ++edit) {
    const Guid site = Site(static_cast<char>('A' + below(3)));
    const ssize_t live = m_recorded.recorder().LiveLength(Field(1));
    ssize_t number = m_recorded.numbers().Next(site);
    ASSERT_LT(number, 9'000);
    if (live > 0 && below(5) < 2) {
      const ssize_t p = below(live);
      const ssize_t n = 1 + below(std::min<ssize_t>(live - p, 9));
      m_recorded.recorder().Delete(site, Field(1), p, n);
      DeleteLive(elements, p, n);
    } else {
      const ssize_t p = below(4) == 0 ? live : below(live + 1);
      const ssize_t n = 1 + below(9);
      m_recorded.recorder().Insert(site, Field(1), p, n);
      const std::size_t place = PlaceOf(elements, p);
      for (ssize_t i = 0; i < n; ++i) {
        elements.insert(elements.begin() + static_cast<std::ptrdiff_t>(place) + i,
                        Element{Opid{site, number++}});
      }
    }
    if (edit % 50 == 0 || edit == 1'499) {
      ASSERT_EQ(Text(Field(1)), RunsText(ExpectedRuns(elements))) << "after edit " << edit;
    }
  }
}

}  // namespace
}  // namespace vemo::test
