#include "history/blame.h"

#include <algorithm>
#include <charconv>
#include <unordered_map>
#include <utility>

#include "history/git_history.h"
#include "history/recorder.h"
#include "history/replay.h"
#include "platform/error.h"

namespace vemo {

namespace {

constexpr std::string_view kObjectPrefix = "object/";
constexpr std::size_t kHexDigits = 16;

// The number at the end of the name of a meta value, behind `prefix`.
std::uint64_t NumberInName(std::string_view name, std::size_t prefix) {
  const std::string_view digits = name.substr(prefix);
  std::uint64_t number = 0;
  const auto result = std::from_chars(digits.data(), digits.data() + digits.size(), number, 16);
  if (digits.size() != kHexDigits || result.ec != std::errc() ||
      result.ptr != digits.data() + digits.size()) {
    throw UsageError("meta value \"" + std::string(name) + "\" should end in 16 hexadecimal digits");
  }
  return number;
}

// What the meta values tell of one site.
class SiteStory {
 public:
  SiteStory(const Snapshot& snapshot, const Guid& site, bool ofGit)
      : m_author(snapshot.Meta(SiteMetaName(site)).value_or("")) {
    if (!ofGit) return;
    std::string prefix = CommitMetaName(site, 0);
    prefix.resize(prefix.size() - kHexDigits);
    snapshot.ScanMeta(prefix, [&](std::string_view name, std::string_view commit) {
      m_commits.emplace_back(static_cast<ssize_t>(NumberInName(name, prefix.size())), commit);
      return true;
    });
  }

  const std::string& Author() const noexcept { return m_author; }

  struct Part {
    std::string commit;
    ssize_t count;
  };
  // The commit of operation `number`, and how many operations from there on are its own, at most `limit`.
  Part CommitFrom(ssize_t number, ssize_t limit) const {
    const auto next =
        std::upper_bound(m_commits.begin(), m_commits.end(), number,
                         [](ssize_t wanted, const auto& commit) { return wanted < commit.first; });
    const ssize_t count = next == m_commits.end() ? limit : std::min(limit, next->first - number);
    return {next == m_commits.begin() ? std::string() : std::prev(next)->second, count};
  }

 private:
  std::string m_author;
  std::vector<std::pair<ssize_t, std::string>> m_commits;  // by first number, ascending
};

class Blamer {
 public:
  Blamer(const Snapshot& snapshot, bool ofGit) : m_snapshot(snapshot), m_ofGit(ofGit) {}

  std::vector<BlameRun> Run(const VectorInsertions& insertions, const VectorTombstones* tombstones) {
    const auto* dead = tombstones == nullptr ? nullptr : tombstones->begin();
    const auto* const deadEnd = tombstones == nullptr ? nullptr : tombstones->end();
    for (const auto* run = insertions.m_c.m_first; run != nullptr; run = run->m_next) {
      const ssize_t end = run->m_q + run->m_n;
      ssize_t q = run->m_q;
      while (q < end) {
        while (dead != deadEnd && dead->t2 <= q) ++dead;
        const bool isDead = dead != deadEnd && dead->t1 <= q;
        const ssize_t stop = dead == deadEnd ? end : std::min(end, isDead ? dead->t2 : dead->t1);
        if (!isDead) AddLive(Opid{run->m_opid.s, run->m_opid.t + (q - run->m_q)}, q, stop - q);
        q = stop;
      }
    }
    return std::move(m_runs);
  }

 private:
  void AddLive(Opid first, ssize_t q, ssize_t n) {
    const SiteStory& story = StoryOf(first.s);
    while (n > 0) {
      SiteStory::Part part = story.CommitFrom(first.t, n);
      m_runs.push_back({m_p, q, part.count, first, story.Author(), std::move(part.commit)});
      m_p += part.count;
      q += part.count;
      first.t += part.count;
      n -= part.count;
    }
  }

  const SiteStory& StoryOf(const Guid& site) {
    const auto known = m_stories.find(site);
    if (known != m_stories.end()) return known->second;
    return m_stories.emplace(site, SiteStory(m_snapshot, site, m_ofGit)).first->second;
  }

  const Snapshot& m_snapshot;
  bool m_ofGit;
  ssize_t m_p = 0;
  std::vector<BlameRun> m_runs;
  std::unordered_map<Guid, SiteStory, GuidHash> m_stories;
};

bool IsGitField(const Snapshot& snapshot, const FieldId& field) {
  return field == FieldOfGitObject(field.oid) && snapshot.Meta(ObjectMetaName(field.oid)).has_value();
}

}  // namespace

std::vector<BlameRun> BlameField(Snapshot& snapshot, const FieldId& field) {
  const auto& insertions = snapshot.Root<FieldIdToVectorInsertionsMap>(kInsertionsRoot);
  const auto& tombstones = snapshot.Root<FieldIdToVectorTombstonesMap>(kTombstonesRoot);
  const bool ofGit = IsGitField(snapshot, field);
  const VectorInsertions* stored = insertions.rFind(field);
  if (stored != nullptr) return Blamer(snapshot, ofGit).Run(*stored, tombstones.rFind(field));
  if (ofGit) return {};
  throw UsageError(snapshot.Space().Name() + ": field " + FieldIdText(field) + " is not recorded");
}

std::optional<FieldId> FindGitField(const Snapshot& snapshot, std::string_view path) {
  std::optional<FieldId> found;
  snapshot.ScanMeta(kObjectPrefix, [&](std::string_view name, std::string_view stored) {
    if (stored == path) found = FieldOfGitObject(OID(NumberInName(name, kObjectPrefix.size())));
    return !found;
  });
  return found;
}

}  // namespace vemo
