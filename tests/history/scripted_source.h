// An edit source that a test writes edit by edit.
#pragma once

#include <map>
#include <string>
#include <vector>

#include "history/edit_source.h"

namespace vemo::test {

class ScriptedSource : public EditSource {
 public:
  // Nothing for a source of many fields, as a repository is.
  explicit ScriptedSource(std::optional<FieldId> onlyField = std::nullopt)
      : m_onlyField(std::move(onlyField)) {}

  // Elements are the single characters of `text`.
  ScriptedSource& Insert(char site, const FieldId& field, ssize_t position, const std::string& text);
  ScriptedSource& Delete(char site, const FieldId& field, ssize_t position, ssize_t n);
  ScriptedSource& CommitBy(char site, const std::string& id);
  ScriptedSource& Object(std::uint64_t object, const std::string& path);
  // The field's file is gone: it has no final content.
  ScriptedSource& DeleteFile(const FieldId& field);

  // The same edits each time for the same seed: `edits` of them by `sites` sites, in fields of which the
  // first steps of the path are 0, ...; with commits and objects between them unless there is only one field.
  static ScriptedSource Random(std::uint64_t seed, int edits, int sites, int fields);
  static ScriptedSource RandomRecording(std::uint64_t seed, int edits, const FieldId& field);

  // Called before the edit with that index; may throw.
  std::function<void(std::uint64_t index)> beforeEdit;
  // The texts that the source says the fields have in the end.
  std::map<FieldId, std::string> contents;

  std::string Describe() const override { return "the script"; }
  std::optional<FieldId> OnlyField() const override { return m_onlyField; }
  std::uint64_t CountEdits() override;
  void Replay(EditVisitor& visitor) override;
  void ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) override;
  SkippedFiles Skipped() override { return {}; }

  static std::string AuthorOf(char site) { return std::string("Author ") + site; }

 private:
  enum class Kind { kEdit, kCommit, kObject };
  struct Step {
    Kind kind;
    char site = 0;
    FieldId field;
    ssize_t position = 0;
    ssize_t deleted = 0;
    std::string text;  // inserted characters, the id of the commit or the path of the object
  };
  static void Visit(const Step& step, EditVisitor& visitor);

  std::optional<FieldId> m_onlyField;
  std::vector<Step> m_steps;
};

}  // namespace vemo::test
