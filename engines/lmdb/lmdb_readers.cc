#include "engines/lmdb/lmdb_readers.h"

#include <lmdb.h>

#include <set>
#include <sstream>
#include <string>

namespace vemo {

// LMDB prints its table as text: process id, thread, and the transaction or a dash.
std::vector<std::int64_t> ProcessesReading(MDB_env* env) {
  std::string table;
  const auto append = [](const char* line, void* text) {
    *static_cast<std::string*>(text) += line;
    return 0;
  };
  mdb_reader_list(env, append, &table);
  std::set<std::int64_t> processes;
  std::istringstream lines(table);
  for (std::string line; std::getline(lines, line);) {
    std::istringstream words(line);
    std::int64_t process = 0;
    std::string thread, transaction;
    if (words >> process >> thread >> transaction && transaction != "-") processes.insert(process);
  }
  return {processes.begin(), processes.end()};
}

}  // namespace vemo
