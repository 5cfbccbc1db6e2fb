#include <fmt/format.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <memory>
#include <nlohmann/json.hpp>
#include <vector>

#include "history/source_error.h"
#include "store/statistics.h"
#include "tool/cache_option.h"
#include "tool/commands.h"
#include "tool/numbers.h"
#include "tool/progress_bar.h"

namespace vemo::tool {

namespace {

using Json = nlohmann::ordered_json;

struct StatsArguments {
  std::string store;
  bool json = false;
  std::optional<std::uint64_t> cacheBytes;
};

// The other processes that have a snapshot open.
std::vector<std::int64_t> ReadersElsewhere(const SpaceStatistics& statistics) {
  std::vector<std::int64_t> processes;
  for (const ReaderInfo& reader : statistics.readers) {
    if (reader.process != getpid()) processes.push_back(reader.process);
  }
  return processes;
}

// --- As JSON ---

Json AmountJson(const Amount& amount) {
  return {{"count", amount.count}, {"bytes", amount.bytes}};
}

Json LevelJson(const LevelStatistics& level, std::size_t height) {
  return {{"height", height},
          {"nodes", level.nodes},
          {"entries", level.entries},
          {"capacity", level.capacity},
          {"fill", {{"least", level.LeastFill()}, {"mean", level.MeanFill()}, {"most", level.MostFill()}}},
          {"record_bytes", level.recordBytes}};
}

Json MapJson(const MapStatistics& map) {
  Json levels = Json::array();
  for (std::size_t height = 0; height < map.levels.size(); ++height) {
    levels.push_back(LevelJson(map.levels[height], height));
  }
  return {
      {"root", map.root.empty() ? Json() : Json(map.root)},
      {"object", map.oid.m_value},
      {"class", map.className},
      {"entries", map.entries},
      {"nodes", map.nodes},
      {"height", map.height},
      {"payload_bytes",
       {{"total", map.payloadBytes}, {"mean", map.MeanPayloadBytes()}, {"largest", map.largestPayloadBytes}}},
      {"record_bytes", map.recordBytes},
      {"levels", std::move(levels)}};
}

std::string JsonText(const std::string& space, const SpaceStatistics& statistics) {
  Json json = {{"space", space},
               {"commit", statistics.commit},
               {"records", AmountJson(statistics.records)},
               {"medium_bytes", statistics.mediumBytes},
               {"awaiting_deletion", AmountJson(statistics.awaitingDeletion)},
               {"unreachable", AmountJson(statistics.unreachable)},
               {"meta", AmountJson(statistics.meta)},
               {"reading_processes", Json::array()},
               {"maps", Json::array()}};
  json["awaiting_deletion"]["queued"] = statistics.queuedDeletions;
  for (const std::int64_t process : ReadersElsewhere(statistics))
    json["reading_processes"].push_back(process);
  for (const MapStatistics& map : statistics.maps) json["maps"].push_back(MapJson(map));
  // The names of roots and spaces may have any bytes; those that are not UTF-8 become U+FFFD.
  return json.dump(2, ' ', false, Json::error_handler_t::replace) + "\n";
}

// --- For people ---

std::string AmountRow(const char* what, const Amount& amount, const std::string& note = "") {
  return fmt::format("  {:<18} {:>14} {:>12}{}\n", what, Grouped(amount.count), ByteSize(amount.bytes), note);
}

std::string SpaceText(const std::string& space, const SpaceStatistics& statistics) {
  std::string text = fmt::format("{} at commit {}\n", OneLine(space), Grouped(statistics.commit));
  text += AmountRow("records", statistics.records);
  text += fmt::format("  {:<18} {:>14} {:>12}\n", "on the medium", "", ByteSize(statistics.mediumBytes));
  text += AmountRow("awaiting deletion", statistics.awaitingDeletion,
                    statistics.queuedDeletions == 0
                        ? ""
                        : fmt::format("  below {} queued", Grouped(statistics.queuedDeletions)));
  text += AmountRow("unreachable", statistics.unreachable);
  text += AmountRow("meta values", statistics.meta);
  const std::vector<std::int64_t> readers = ReadersElsewhere(statistics);
  if (!readers.empty()) {
    text += fmt::format("  {:<18} {:>14} {:>12}  {}\n", "reading processes", readers.size(), "",
                        fmt::join(readers, ", "));
  }
  return text;
}

std::string MapText(const MapStatistics& map) {
  std::string text = fmt::format("\n{}, a {}, object {}\n",
                                 map.root.empty() ? "an owned map" : "\"" + OneLine(map.root) + "\"",
                                 map.className, map.oid.m_value);
  text += fmt::format("  {} entries, {} nodes, height {}, records {}\n", Grouped(map.entries),
                      Grouped(map.nodes), map.height, ByteSize(map.recordBytes));
  if (map.entries > 0) {
    text += fmt::format("  payloads {}, mean {:.1f} bytes, largest {}\n", ByteSize(map.payloadBytes),
                        map.MeanPayloadBytes(), ByteSize(map.largestPayloadBytes));
  }
  if (map.levels.empty()) return text;
  text += fmt::format("  {:>6} {:>12} {:>12} {:>6} {:>6} {:>6} {:>12}\n", "level", "nodes", "entries",
                      "least", "mean", "most", "records");
  for (std::size_t height = map.levels.size(); height-- > 0;) {
    const LevelStatistics& level = map.levels[height];
    text += fmt::format("  {:>6} {:>12} {:>12} {:>5.0f}% {:>5.0f}% {:>5.0f}% {:>12}\n", height,
                        Grouped(level.nodes), Grouped(level.entries), 100 * level.LeastFill(),
                        100 * level.MeanFill(), 100 * level.MostFill(), ByteSize(level.recordBytes));
  }
  return text;
}

ExitCode RunStats(const StatsArguments& arguments) {
  const auto space = CSpace::Open(arguments.store, {.cacheBytes = arguments.cacheBytes});
  Snapshot snapshot(*space);
  SpaceStatistics statistics;
  {
    ProgressBar bar("reading", space->Usage().records);
    statistics = CollectStatistics(snapshot, [&bar](std::uint64_t done) { bar.Update(done); });
  }
  if (arguments.json) {
    fmt::print("{}", JsonText(space->Name(), statistics));
    return kGood;
  }
  std::string text = SpaceText(space->Name(), statistics);
  for (const MapStatistics& map : statistics.maps) text += MapText(map);
  fmt::print("{}", text);
  return kGood;
}

}  // namespace

void AddStatsCommand(CLI::App& app, Command& chosen) {
  auto arguments = std::make_shared<StatsArguments>();
  CLI::App* command = app.add_subcommand("stats", "Print how large the space and its maps are, and how full");
  command->add_option("store", arguments->store, "The space: lmdb:PATH")->required();
  command->add_flag("--json", arguments->json, "Print a JSON object instead of tables");
  AddCacheOption(*command, arguments->cacheBytes);
  command->footer(
      "Level 0 is the leaves. Fill is the share of a node's capacity: of the emptiest node, the mean, of the "
      "fullest.\n"
      "Example:\n"
      "  vemo stats lmdb:/tmp/history");
  command->callback([arguments, &chosen] { chosen = [arguments] { return RunStats(*arguments); }; });
}

}  // namespace vemo::tool
