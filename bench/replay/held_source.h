// An edit source that holds its edits in memory.
#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "history/edit_source.h"

namespace vemo::bench {

// The first edits of another source, with the sites, objects and commits that belong to them: replaying it
// costs neither parsing nor a process of git.
class HeldSource : public EditSource {
 public:
  // Reads `source` to its end. Throws std::runtime_error when it has fewer than `edits` edits.
  HeldSource(EditSource& source, std::size_t edits);

  std::string Describe() const override { return m_description; }
  std::optional<FieldId> OnlyField() const override { return m_onlyField; }
  std::uint64_t CountEdits() override { return m_edits; }
  void Replay(EditVisitor& visitor) override;
  // A part of a history has no final content that anybody knows.
  void ForEachFinalContent(const std::function<void(const FinalContent&)>&) override {}
  SkippedFiles Skipped() override { return {}; }

 private:
  class Recorder;
  // One call of a visitor.
  struct Event {
    enum class Kind { kSite, kObject, kCommit, kEdit } kind;
    Guid site{};
    OID object{};
    FieldId field{};
    ssize_t position = 0;
    ssize_t deleted = 0;
    std::vector<std::string> texts{};  // the author; the path; commit id and author; the inserted elements
  };

  std::string m_description;
  std::optional<FieldId> m_onlyField;
  std::uint64_t m_edits = 0;
  std::vector<Event> m_events;
};

}  // namespace vemo::bench
