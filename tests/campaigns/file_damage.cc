#include "tests/campaigns/file_damage.h"

#include <unistd.h>

#include <algorithm>
#include <random>
#include <string>

#include "engines/lmdb/lmdb_engine.h"
#include "tests/campaigns/scratch_folder.h"
#include "tests/engines/child_process.h"
#include "tests/engines/damaged_space.h"

namespace vemo::campaign {

using namespace test;

namespace {

class FileDamage {
 public:
  explicit FileDamage(const FileDamageOptions& options)
      : m_options(options), m_verdict(options.rollback ? "file_damage of whole files" : "file_damage", options.seed), m_random(options.seed) {}

  Verdict Run() {
    m_verdict.Count("damages", 0);
    while (!IsDone()) DamageOneSpace();
    return std::move(m_verdict);
  }

 private:
  bool IsDone() const {
    return m_verdict.CountOf("damages") >= m_options.damages || m_verdict.faults().size() >= m_options.maxFaults;
  }

  void DamageOneSpace() {
    MakeSpace(2 + m_random() % 40);
    m_verdict.Count("spaces");
    const std::uint64_t seed = m_random();
    const std::uint64_t count = std::min(m_options.damagesPerSpace, m_options.damages - m_verdict.CountOf("damages"));
    // One child judges many; after one that dies the next goes on behind it.
    for (std::uint64_t next = 0; next < count && !IsDone();) {
      ChildProcess child([&](const Conversation& parent) {
        for (std::uint64_t i = next; i < count; ++i) {
          ::alarm(60);
          std::mt19937_64 random(seed + i);
          SpaceFiles files = m_files;
          parent.Say(m_options.rollback ? RollBack(files) : Damage(files, random));
          parent.Say(Judge(files, random));
        }
        return true;
      });
      for (; next < count && !IsDone(); ++next) {
        const std::string damage = child.Hear();
        const std::string verdict = child.Hear();
        m_verdict.Count("damages");
        if (verdict == kRefused) {
          m_verdict.Count("refused somewhere");
        } else if (verdict != kNoMatter) {
          m_verdict.AddFault(damage + ": " + (verdict.empty() ? "the process ends" : verdict));
        }
        if (verdict.empty()) {
          ++next;
          break;
        }
      }
    }
  }

  void MakeSpace(std::size_t commits) {
    std::filesystem::remove_all(Space());
    m_model = {};
    LmdbOptions options;
    options.path = Space();
    options.create = true;
    options.syncEachCommit = false;
    for (std::size_t i = 0; i < commits; ++i) {
      if (i + 1 == commits) m_older = SpaceFiles::Read(Space());
      const auto engine = OpenLmdbEngine(options);
      // Half of the spaces end with commits in the log.
      if (i % 8 < 4 || commits % 2 == 0) {
        m_model.Commit(*engine, m_random, 1 + m_random() % 80);
      } else {
        m_model.CommitEdits(*engine, m_random, m_random() % 8);
      }
    }
    m_files = SpaceFiles::Read(Space());
  }

  std::string RollBack(SpaceFiles& files) const {
    files = m_older;
    return "the files of the commit before";
  }

  std::string Judge(const SpaceFiles& files, std::mt19937_64& random) const {
    try {
      files.Write(Space());
      return ExamineDamagedSpace(Space(), m_model, random) ? kRefused : kNoMatter;
    } catch (const std::exception& wrong) {
      std::string text = wrong.what();
      for (char& c : text) {
        if (c == '\n') c = ' ';
      }
      return text;
    }
  }

  std::filesystem::path Space() const { return m_folder.path() / "space"; }

  static constexpr const char* kRefused = "refused";
  static constexpr const char* kNoMatter = "no matter";

  FileDamageOptions m_options;
  Verdict m_verdict;
  std::mt19937_64 m_random;
  ScratchFolder m_folder;
  SpaceModel m_model;
  SpaceFiles m_files;
  SpaceFiles m_older;  // of the commit before
};

}  // namespace

Verdict RunFileDamage(const FileDamageOptions& options) { return FileDamage(options).Run(); }

}  // namespace vemo::campaign
