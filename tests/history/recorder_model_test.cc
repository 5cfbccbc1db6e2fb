// The recorder against a model that keeps every element by itself.
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>
#include <vector>

#include "recorded_fields.h"
#include "tests/support/seed.h"
#include "vxUtils/ByteForms.h"

namespace vemo::test {
namespace {

struct Element {
  char site;
  ssize_t number;
  char deletedBy = 0;  // 0: it is live
  ssize_t deletion = 0;
};

// One field, element by element in q order.
class FieldModel {
 public:
  ssize_t LiveLength() const {
    return std::count_if(m_elements.begin(), m_elements.end(),
                         [](const Element& e) { return e.deletedBy == 0; });
  }

  void Insert(char site, ssize_t first, ssize_t position, ssize_t n) {
    const std::size_t q = position == 0 ? 0 : LiveAt(position - 1) + 1;
    std::vector<Element> added;
    for (ssize_t i = 0; i < n; ++i) added.push_back({site, first + i});
    m_elements.insert(m_elements.begin() + static_cast<std::ptrdiff_t>(q), added.begin(), added.end());
  }

  void Delete(char site, ssize_t first, ssize_t position, ssize_t n) {
    for (ssize_t i = 0; i < n; ++i) {
      Element& element = m_elements[LiveAt(position)];
      element.deletedBy = site;
      element.deletion = first + i;
    }
  }

  // The bytes that the three payloads should have: neighbours that continue each other as one run.
  Bytes InsertionBytes() const { return ToBytes(Insertions()); }
  Bytes TombstoneBytes() const {
    VectorTombstones tombstones;
    auto& runs = tombstones.m_tombstones;
    for (ssize_t q = 0; q < size(); ++q) {
      if (At(q).deletedBy == 0) continue;
      if (runs.size() > 0 && runs[runs.size() - 1].t2 == q) {
        ++runs[runs.size() - 1].t2;
      } else {
        runs.push_back({q, q + 1});
      }
    }
    return ToBytes(tombstones);
  }
  Bytes HistoryBytes() const {
    VectorInsertionsAndDeletions history;
    history.m_insertions = Insertions();
    VectorDeletions::Node* last = nullptr;
    for (ssize_t q = 0; q < size(); ++q) {
      const Element& element = At(q);
      if (element.deletedBy == 0) continue;
      if (last != nullptr && last->m_q + last->m_n == q && last->m_opid.s == Site(element.deletedBy) &&
          last->m_opid.t + last->m_n == element.deletion) {
        ++last->m_n;
        continue;
      }
      VectorDeletionInterval run;
      run.m_opid = {Site(element.deletedBy), element.deletion};
      run.m_q = q;
      run.m_n = 1;
      last = history.m_deletions.InsertAfter(last, run);
    }
    return ToBytes(history);
  }

 private:
  ssize_t size() const { return static_cast<ssize_t>(m_elements.size()); }
  const Element& At(ssize_t q) const { return m_elements[static_cast<std::size_t>(q)]; }

  std::size_t LiveAt(ssize_t position) const {
    std::size_t q = 0;
    while (m_elements[q].deletedBy != 0 || position-- > 0) ++q;
    return q;
  }

  VectorInsertions Insertions() const {
    VectorInsertions insertions;
    insertions.m_u2 = size();
    VectorInsertions::List::Node* last = nullptr;
    for (ssize_t q = 0; q < size(); ++q) {
      const Element& element = At(q);
      if (last != nullptr && last->m_opid.s == Site(element.site) && last->m_u + 1 == element.number) {
        ++last->m_n;
        ++last->m_u;
        continue;
      }
      VectorInsertionInterval run;
      run.m_opid = {Site(element.site), element.number};
      run.m_q = q;
      run.m_n = 1;
      run.m_u = element.number;
      last = insertions.m_c.InsertAfter(last, run);
    }
    return insertions;
  }

  std::vector<Element> m_elements;
};

struct RandomEdit {
  char site;
  std::uint64_t field;
  bool isDeletion;
  ssize_t position;
  ssize_t n;
};

struct Workload {
  const char* name;
  std::uint64_t fields;
  int sites;
  bool local;        // the next edit is mostly where the last one of its field was
  double deletions;  // share
  ssize_t longestEdit;
};

// Applies edits to a model of each field.
class Models {
 public:
  void Apply(const RandomEdit& edit) {
    ssize_t& next = m_next[edit.site];
    FieldModel& model = m_fields[edit.field];
    if (edit.isDeletion) {
      model.Delete(edit.site, next, edit.position, edit.n);
    } else {
      model.Insert(edit.site, next, edit.position, edit.n);
    }
    next += edit.n;
  }
  FieldModel& operator[](std::uint64_t field) { return m_fields[field]; }

  PayloadBytes Contents() const {
    PayloadBytes bytes;
    for (const auto& [field, model] : m_fields) Add(field, model, bytes);
    return bytes;
  }
  PayloadBytes ContentsOf(std::uint64_t field) const {
    PayloadBytes bytes;
    Add(field, m_fields.at(field), bytes);
    return bytes;
  }

 private:
  static void Add(std::uint64_t field, const FieldModel& model, PayloadBytes& bytes) {
    const std::string name = " " + FieldIdText(Field(field));
    bytes[kInsertionsRoot + name] = model.InsertionBytes();
    bytes[kTombstonesRoot + name] = model.TombstoneBytes();
    bytes[kHistoryRoot + name] = model.HistoryBytes();
  }

  std::map<std::uint64_t, FieldModel> m_fields;
  std::map<char, ssize_t> m_next;
};

class EditGenerator {
 public:
  EditGenerator(const Workload& workload, std::uint64_t seed) : m_workload(workload), m_random(seed) {}

  RandomEdit Next(Models& models) {
    RandomEdit edit{};
    edit.site = static_cast<char>('A' + Below(m_workload.sites));
    edit.field = 1 + static_cast<std::uint64_t>(Below(static_cast<ssize_t>(m_workload.fields)));
    const ssize_t live = models[edit.field].LiveLength();
    ssize_t& last = m_lastPosition[edit.field];
    const ssize_t near = std::clamp<ssize_t>(last + Below(3) - 1, 0, live);
    edit.position = m_workload.local && Below(20) > 0 ? near : Below(live + 1);
    edit.n = 1 + Below(m_workload.longestEdit);
    edit.isDeletion =
        edit.position < live && static_cast<double>(Below(1'000)) < 1'000 * m_workload.deletions;
    if (edit.isDeletion) edit.n = std::min(edit.n, live - edit.position);
    last = edit.isDeletion ? edit.position : edit.position + edit.n;
    return edit;
  }

  ssize_t Below(ssize_t limit) { return std::uniform_int_distribution<ssize_t>(0, limit - 1)(m_random); }

 private:
  const Workload& m_workload;
  std::mt19937_64 m_random;
  std::map<std::uint64_t, ssize_t> m_lastPosition;
};

void Record(RecordingSpace& recorded, const RandomEdit& edit) {
  if (edit.isDeletion) {
    recorded.recorder().Delete(Site(edit.site), Field(edit.field), edit.position, edit.n);
  } else {
    recorded.recorder().Insert(Site(edit.site), Field(edit.field), edit.position, edit.n);
  }
}

// The payloads of one field, settled.
PayloadBytes ContentsOf(RecordingSpace& recorded, std::uint64_t field) {
  recorded.Settle();
  const FieldId id = Field(field);
  const std::string name = " " + FieldIdText(id);
  return {{kInsertionsRoot + name, ToBytes(*std::as_const(recorded.insertions()).rFind(id))},
          {kTombstonesRoot + name, ToBytes(*std::as_const(recorded.tombstones()).rFind(id))},
          {kHistoryRoot + name, ToBytes(*std::as_const(recorded.history()).rFind(id))}};
}

class RecorderModelTest : public ::testing::TestWithParam<Workload> {};

TEST_P(RecorderModelTest, AgreesWithTheModelAfterEveryEdit) {
  const std::uint64_t seed = TestSeed(6'001);
  RecordingSpace recorded;
  Models models;
  EditGenerator generator(GetParam(), seed);
  for (int i = 0; i < 700; ++i) {
    const RandomEdit edit = generator.Next(models);
    Record(recorded, edit);
    models.Apply(edit);
    ASSERT_EQ(recorded.recorder().LiveLength(Field(edit.field)), models[edit.field].LiveLength())
        << "edit " << i;
    ASSERT_EQ(ContentsOf(recorded, edit.field), models.ContentsOf(edit.field)) << "edit " << i;
  }
  EXPECT_EQ(recorded.Contents(), models.Contents());
}

// Settling, committing and beginning with a recorder that remembers nothing are of no consequence.
TEST_P(RecorderModelTest, AgreesWithTheModelHoweverOftenItSettles) {
  const std::uint64_t seed = TestSeed(6'002);
  for (const ssize_t settlesEvery : {1, 3, 40, 100'000}) {
    RecordingSpace recorded;
    Models models;
    EditGenerator generator(GetParam(), seed);
    std::mt19937_64 moments(seed);
    for (int i = 0; i < 1'500; ++i) {
      const RandomEdit edit = generator.Next(models);
      Record(recorded, edit);
      models.Apply(edit);
      if (moments() % static_cast<std::uint64_t>(settlesEvery) != 0) continue;
      if (moments() % 20 == 0) {
        recorded.Commit();
      } else {
        recorded.Settle();
      }
    }
    EXPECT_EQ(recorded.Contents(), models.Contents()) << "settled once in " << settlesEvery << " edits";
    recorded.Commit();
    EXPECT_EQ(CommittedBytes(recorded.space()), models.Contents());
  }
}

INSTANTIATE_TEST_SUITE_P(Workloads, RecorderModelTest,
                         ::testing::Values(Workload{"LikeTyping", 1, 1, true, 0.3, 4},
                                           Workload{"Anywhere", 1, 1, false, 0.45, 3},
                                           Workload{"TwoSitesTyping", 1, 2, true, 0.4, 6},
                                           Workload{"ManyFieldsAndSites", 250, 5, true, 0.3, 8},
                                           Workload{"MostlyDeleting", 3, 3, false, 0.7, 12}),
                         [](const auto& tested) { return tested.param.name; });

}  // namespace
}  // namespace vemo::test
