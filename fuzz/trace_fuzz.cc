// Recordings in JSON, plain and compressed: opened whole or refused, and replayed within their document.
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <string>

#include "history/edit_source.h"
#include "history/source_error.h"

namespace {

using namespace vemo;

class Counter : public EditVisitor {
 public:
  void OnSite(const Guid&, std::string_view) override {}
  void OnObject(OID, std::string_view) override {}
  void OnCommit(const Commit&) override {}
  void OnEdit(const Edit& edit) override {
    if (edit.position < 0 || edit.position + edit.deleted > m_length) std::abort();
    m_length += static_cast<ssize_t>(edit.inserted.size()) - edit.deleted;
    ++m_edits;
  }
  ssize_t m_length = 0;
  std::uint64_t m_edits = 0;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const int file = ::memfd_create("trace", 0);
  static const std::string path = "/proc/self/fd/" + std::to_string(file);
  if (::ftruncate(file, 0) != 0 || ::pwrite(file, data, size, 0) != static_cast<ssize_t>(size)) std::abort();
  try {
    const auto source = OpenTrace(path, FieldId{OID(1), Path{0}}, "author");
    Counter counter;
    source->Replay(counter);
    if (counter.m_edits != source->CountEdits()) std::abort();
  } catch (const SourceError&) {
    return 0;
  }
  return 0;
}
