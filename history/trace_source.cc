// Recorded sessions in JSON. Everything is checked when the file is opened, so that a replay never stops
// half-way.
#include <simdjson.h>

#include <cstdint>
#include <utility>
#include <vector>

#include "history/edit_source.h"
#include "history/gzip_file.h"
#include "history/site.h"
#include "history/source_error.h"
#include "history/utf8.h"

namespace vemo {

namespace {

namespace dom = simdjson::dom;

// One patch of a recording: deletes `deleted` code points at `position`, then inserts text there.
struct Patch {
  ssize_t position;
  ssize_t deleted;
  std::string_view inserted;
};

struct Recording {
  dom::parser parser;  // owns the bytes of the strings
  std::string_view endContent;
  std::vector<Patch> patches;
};

// Reads and checks a recording. Messages name the file, the transaction and the patch; both count from 0.
class RecordingReader {
 public:
  RecordingReader(const std::filesystem::path& file, Recording& recording)
      : m_file(file), m_recording(recording) {}
  void Read();

 private:
  [[noreturn]] void Throw(const std::string& reason) const;
  std::string Place() const;
  template <typename Value>
  Value Get(const dom::object& object, const char* name, const char* type) const;
  void CheckKind(const dom::object& root) const;
  void ReadPatch(const dom::element& element);
  ssize_t ReadNumber(const dom::element& element, const char* name) const;

  const std::filesystem::path& m_file;
  Recording& m_recording;
  bool m_isInTransaction = false;
  std::size_t m_transaction = 0;
  bool m_isInPatch = false;
  std::size_t m_patch = 0;
  ssize_t m_length = 0;  // of the document, in code points
};

std::string RecordingReader::Place() const {
  std::string place = m_file.string() + ": ";
  if (m_isInTransaction) place += "transaction " + std::to_string(m_transaction);
  if (m_isInPatch) place += ", patch " + std::to_string(m_patch);
  if (m_isInTransaction) place += ": ";
  return place;
}

void RecordingReader::Throw(const std::string& reason) const {
  throw SourceError(Place() + reason);
}

template <typename Value>
Value RecordingReader::Get(const dom::object& object, const char* name, const char* type) const {
  dom::element element;
  if (object.at_key(name).get(element) != simdjson::SUCCESS)
    Throw(std::string("there is no field \"") + name + '"');
  Value value;
  if (element.get(value) != simdjson::SUCCESS)
    Throw(std::string("the field \"") + name + "\" is not " + type);
  return value;
}

void RecordingReader::CheckKind(const dom::object& root) const {
  dom::element kind;
  if (root.at_key("kind").get(kind) != simdjson::SUCCESS) return;  // the sequential recordings name no kind
  std::string_view name;
  if (kind.get(name) != simdjson::SUCCESS) Throw("the field \"kind\" is not a string");
  if (name == "concurrent")
    Throw("this is a recording of concurrent authors; only those of one author can be replayed");
  if (name != "sequential") Throw("recordings of the kind \"" + std::string(name) + "\" are not known");
}

ssize_t RecordingReader::ReadNumber(const dom::element& element, const char* name) const {
  std::int64_t number = 0;
  if (element.get(number) != simdjson::SUCCESS) Throw(std::string("the ") + name + " is not a whole number");
  return number;
}

void RecordingReader::ReadPatch(const dom::element& element) {
  dom::array parts;
  if (element.get(parts) != simdjson::SUCCESS || parts.size() != 3) {
    Throw("a patch is not an array of position, deleted count and inserted text");
  }
  Patch patch;
  patch.position = ReadNumber(parts.at(0).value_unsafe(), "position");
  patch.deleted = ReadNumber(parts.at(1).value_unsafe(), "deleted count");
  if (parts.at(2).get(patch.inserted) != simdjson::SUCCESS) Throw("the inserted text is not a string");
  const auto inserted = static_cast<ssize_t>(CountCodePoints(patch.inserted));
  if (patch.position < 0 || patch.position > m_length) {
    Throw("the position " + std::to_string(patch.position) + " is out of range in a document of " +
          std::to_string(m_length) + " code points");
  }
  if (patch.deleted < 0 || patch.deleted > m_length - patch.position) {
    Throw("the deleted count " + std::to_string(patch.deleted) + " at position " +
          std::to_string(patch.position) + " is out of range in a document of " + std::to_string(m_length) +
          " code points");
  }
  m_length += inserted - patch.deleted;
  m_recording.patches.push_back(patch);
}

void RecordingReader::Read() {
  std::string json = ReadMaybeGzipFile(m_file);
  json.reserve(json.size() + simdjson::SIMDJSON_PADDING);
  dom::element root;
  const simdjson::error_code error = m_recording.parser.parse(json).get(root);
  if (error != simdjson::SUCCESS) {
    Throw(std::string("this is not a complete JSON document: ") + simdjson::error_message(error));
  }
  dom::object recording;
  if (root.get(recording) != simdjson::SUCCESS) Throw("the JSON document is not an object");
  CheckKind(recording);
  if (!Get<std::string_view>(recording, "startContent", "a string").empty()) {
    Throw(
        "the field \"startContent\" is not empty; only recordings that start with an empty document can be "
        "replayed");
  }
  m_recording.endContent = Get<std::string_view>(recording, "endContent", "a string");
  const auto transactions = Get<dom::array>(recording, "txns", "an array");
  m_isInTransaction = true;
  for (const dom::element& element : transactions) {
    dom::object transaction;
    if (element.get(transaction) != simdjson::SUCCESS) Throw("this is not an object");
    const auto patches = Get<dom::array>(transaction, "patches", "an array");
    m_isInPatch = true;
    m_patch = 0;
    for (const dom::element& patch : patches) {
      ReadPatch(patch);
      ++m_patch;
    }
    m_isInPatch = false;
    ++m_transaction;
  }
}

class TraceSource : public EditSource {
 public:
  TraceSource(const std::filesystem::path& file, const FieldId& field, std::string_view author)
      : m_file(file), m_field(field), m_author(author) {
    RecordingReader(m_file, m_recording).Read();
  }

  std::optional<FieldId> OnlyField() const override { return m_field; }
  std::string Describe() const override { return "recording " + m_file.string(); }
  SkippedFiles Skipped() override { return {}; }

  std::uint64_t CountEdits() override {
    std::uint64_t edits = 0;
    for (const Patch& patch : m_recording.patches) edits += (patch.deleted != 0) + !patch.inserted.empty();
    return edits;
  }

  void Replay(EditVisitor& visitor) override {
    Edit edit;
    edit.site = SiteOfAuthor(m_author);
    edit.field = m_field;
    if (CountEdits() != 0) visitor.OnSite(edit.site, m_author);
    std::vector<std::string_view> codePoints;
    for (const Patch& patch : m_recording.patches) {
      edit.position = patch.position;
      edit.deleted = patch.deleted;
      edit.inserted = {};
      if (edit.deleted != 0) visitor.OnEdit(edit);
      edit.deleted = 0;
      SplitCodePoints(patch.inserted, codePoints);
      edit.inserted = codePoints;
      if (!codePoints.empty()) visitor.OnEdit(edit);
    }
  }

  void ForEachFinalContent(const std::function<void(const FinalContent&)>& visit) override {
    visit(FinalContent{m_field, m_file.filename().string(), std::string(m_recording.endContent)});
  }

 private:
  std::filesystem::path m_file;
  FieldId m_field;
  std::string m_author;
  Recording m_recording;
};

}  // namespace

std::unique_ptr<EditSource> OpenTrace(const std::filesystem::path& file, const FieldId& field,
                                      std::string_view author) {
  return std::make_unique<TraceSource>(file, field, author);
}

}  // namespace vemo
