// What git may print, and what it never would: read or refused, and two readings are the same.
#include <cstdlib>
#include <string_view>

#include "history/git_history.h"
#include "history/source_error.h"

namespace {

using namespace vemo;

void Read(std::string_view log, GitLogVisitor& visitor) {
  GitLogParser parser(visitor);
  while (!log.empty()) {
    const std::size_t end = log.find('\n');
    parser.Line(log.substr(0, end));
    log.remove_prefix(end == std::string_view::npos ? log.size() : end + 1);
  }
  parser.End();
}

class Discarding : public EditVisitor {
 public:
  void OnSite(const Guid&, std::string_view) override {}
  void OnObject(OID, std::string_view) override {}
  void OnCommit(const Commit&) override {}
  void OnEdit(const Edit&) override { ++m_edits; }
  std::uint64_t m_edits = 0;
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string_view log(reinterpret_cast<const char*>(data), size);
  GitHistory history;
  try {
    GitHistoryScan scan;
    Read(log, scan);
    history = scan.Take();
  } catch (const SourceError&) {
    return 0;
  }
  Discarding visitor;
  GitHistoryReplay replay(history, visitor);
  Read(log, replay);
  replay.CheckComplete();
  if (visitor.m_edits != history.edits) std::abort();
  return 0;
}
