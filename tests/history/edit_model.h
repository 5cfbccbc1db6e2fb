// What the fields hold after the edits of a source, kept in the plainest way.
#pragma once

#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "history/edit_source.h"

namespace vemo::test {

// A sequence of strings with a gap where the last edit was, since the next one is mostly near.
class GapSequence {
 public:
  std::size_t size() const { return m_before.size() + m_after.size(); }
  void Delete(std::size_t position, std::size_t count);
  void Insert(std::size_t position, std::span<const std::string_view> elements);
  std::string Joined() const;
  std::vector<std::string> Elements() const;

 private:
  void MoveGapTo(std::size_t position);

  std::vector<std::string> m_before;
  std::vector<std::string> m_after;  // the last element comes first
};

// Applies the edits and checks what every source promises about its calls; a broken promise is a failure of
// the test.
class EditModel : public EditVisitor {
 public:
  void OnSite(const Guid& site, std::string_view author) override;
  void OnObject(OID object, std::string_view path) override;
  void OnCommit(const Commit& commit) override;
  void OnEdit(const Edit& edit) override;

  struct Author {
    Guid site;
    std::string text;
  };

  std::map<FieldId, GapSequence> fields;
  std::vector<Author> authors;         // in the order of OnSite
  std::vector<std::string> paths;      // those of the objects 1, 2, ...
  std::vector<std::string> commits;    // "AUTHOR" of each
  std::vector<std::string> commitIds;  // of each
  std::vector<std::string> log;        // each edit as text: "1:0 @3 -2" or "1:0 @3 +1"
  std::uint64_t edits = 0;
};

// Replays the source twice and checks that both replays are equal, that CountEdits is right, and that the
// fields of the model hold the final contents, all others nothing. Returns the model.
EditModel ReplayAndCheck(EditSource& source);

// The message of the SourceError that `action` throws; fails the test where it throws none or the message has
// more than one line.
std::string SourceErrorOf(const std::function<void()>& action);

}  // namespace vemo::test
