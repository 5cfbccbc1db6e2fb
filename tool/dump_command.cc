#include <CLI/CLI.hpp>
#include <iostream>
#include <memory>

#include "platform/error.h"
#include "platform/xostream.h"
#include "store/snapshot.h"
#include "tool/commands.h"
#include "vxOperation/src/WorkingSet/CompOp/VectorOT.h"

namespace vemo::tool {

namespace {

// Writes the map if it is of this class.
template <class Map>
bool WriteIfOfClass(ptr<IPersistable> object, xostream& os) {
  if (object.Table() != IPersistable::Stubs<Map>::GetTable()) return false;
  static_cast<const Map*>(object.m_self)->Write(os);
  return true;
}

ExitCode RunDump(const std::string& store, const std::string& name) {
  const auto space = CSpace::Open(store);
  Snapshot snapshot(*space);
  const ptr<IPersistable> map = snapshot.RootMap(name);
  xostream os(std::cout);
  WriteIfOfClass<FieldIdToVectorInsertionsMap>(map, os) || WriteIfOfClass<FieldIdToVectorTombstonesMap>(map, os) ||
      WriteIfOfClass<FieldIdToVectorInsertionsAndDeletionsMap>(map, os);
  std::cout.flush();
  if (!std::cout) throw StoreError("the dump could not be written to standard output");
  return kGood;
}

}  // namespace

void AddDumpCommand(CLI::App& app, Command& chosen) {
  struct Arguments {
    std::string store;
    std::string map;
  };
  auto arguments = std::make_shared<Arguments>();
  CLI::App* command = app.add_subcommand("dump", "Print a root map as text");
  command->add_option("store", arguments->store, "The space: lmdb:PATH")->required();
  command->add_option("map", arguments->map, "The name of the root map, such as insertions")->required();
  command->footer("Example:\n  vemo dump lmdb:/tmp/history tombstones");
  command->callback([arguments, &chosen] {
    chosen = [arguments] { return RunDump(arguments->store, arguments->map); };
  });
}

}  // namespace vemo::tool
