#include "tests/campaigns/disk_trace.h"

#include <algorithm>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>

namespace vemo::campaign {

namespace {

std::string ReadFile(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  std::string bytes((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  if (!file) throw std::runtime_error("cannot read " + path.string());
  return bytes;
}

struct FileContent {
  std::string synced;
  std::vector<const DiskEntry*> sinceSync;  // writes and truncations, those among them that are durable by themselves too
};
using FilePtr = std::shared_ptr<FileContent>;
using Folder = std::map<std::string, FilePtr>;

void Apply(std::string& content, const DiskEntry& entry, std::size_t from, std::size_t size) {
  if (entry.op == DiskOp::kTruncate) {
    content.resize(entry.offset);
    return;
  }
  const std::size_t begin = entry.offset + from;
  if (content.size() < begin + size) content.resize(begin + size);
  std::memcpy(content.data() + begin, entry.data.data() + from, size);
}

void Apply(std::string& content, const DiskEntry& entry) { Apply(content, entry, 0, entry.data.size()); }

// The folder while a trace is played: names and contents as the process sees them, and what of both is synced.
class Disk {
 public:
  explicit Disk(const FolderImage& before) {
    for (const auto& [name, bytes] : before) m_names[name] = std::make_shared<FileContent>(FileContent{bytes, {}});
    m_syncedNames = m_names;
  }

  void Play(const DiskEntry& entry) {
    switch (entry.op) {
      case DiskOp::kCreate:
      case DiskOp::kRename:
      case DiskOp::kUnlink:
        ChangeName(m_names, entry, true);
        m_nameChanges.push_back(&entry);
        break;
      case DiskOp::kWrite:
      case DiskOp::kTruncate: m_names.at(entry.name)->sinceSync.push_back(&entry); break;
      case DiskOp::kSync: Sync(*m_names.at(entry.name)); break;
      case DiskOp::kSyncFolder:
        m_syncedNames = m_names;
        m_nameChanges.clear();
        break;
      case DiskOp::kMark: break;
    }
  }

  FolderImage Survivors(Survival survival, std::mt19937_64& random) {
    Folder names = m_syncedNames;
    for (const DiskEntry* change : m_nameChanges) {
      if (survival == Survival::kAll || (survival != Survival::kNone && random() % 2 == 0)) ChangeName(names, *change, false);
    }
    FolderImage image;
    for (const auto& [name, file] : names) image[name] = Survivor(*file, survival, random);
    return image;
  }

 private:
  static void Sync(FileContent& file) {
    for (const DiskEntry* change : file.sinceSync) Apply(file.synced, *change);
    file.sinceSync.clear();
  }

  // A file that is made is remembered under its entry, so that it is the same one wherever its name survives.
  void ChangeName(Folder& names, const DiskEntry& entry, bool isNew) {
    switch (entry.op) {
      case DiskOp::kCreate:
        if (isNew) m_made[&entry] = std::make_shared<FileContent>();
        names[entry.name] = m_made.at(&entry);
        break;
      case DiskOp::kRename:
        if (const auto found = names.find(entry.name); found != names.end()) {
          names[entry.data] = found->second;
          names.erase(entry.name);
        }
        break;
      default: names.erase(entry.name);
    }
  }

  static std::string Survivor(const FileContent& file, Survival survival, std::mt19937_64& random) {
    std::string content = file.synced;
    const bool isTorn = survival == Survival::kTornSectors || survival == Survival::kTornPages;
    const bool inPages = survival == Survival::kSomePages || survival == Survival::kTornPages;
    const std::size_t piece = inPages ? 4'096 : 512;
    const std::size_t torn = file.sinceSync.empty() ? 0 : random() % file.sinceSync.size();
    for (std::size_t i = 0; i < file.sinceSync.size(); ++i) {
      const DiskEntry& change = *file.sinceSync[i];
      if (change.durable || survival == Survival::kAll || (isTorn && i < torn)) {
        Apply(content, change);
      } else if (survival == Survival::kNone || (isTorn && i > torn)) {
        continue;
      } else if (survival == Survival::kSomeWrites || change.op == DiskOp::kTruncate) {
        if (random() % 2 == 0) Apply(content, change);
      } else {
        ApplyPieces(content, change, piece, isTorn, random);
      }
    }
    return content;
  }

  // Pieces end where the disk's own end, wherever the write begins.
  static void ApplyPieces(std::string& content, const DiskEntry& write, std::size_t piece, bool isTorn,
                          std::mt19937_64& random) {
    for (std::size_t from = 0; from < write.data.size();) {
      const std::size_t size = std::min(write.data.size() - from, piece - (write.offset + from) % piece);
      if (random() % (isTorn ? 4 : 2) == 0) {
        if (isTorn) return;
      } else {
        Apply(content, write, from, size);
      }
      from += size;
    }
  }

  Folder m_names;
  Folder m_syncedNames;
  std::vector<const DiskEntry*> m_nameChanges;
  std::map<const DiskEntry*, FilePtr> m_made;
};

}  // namespace

FolderImage ReadFolder(const std::filesystem::path& folder) {
  FolderImage image;
  for (const auto& entry : std::filesystem::directory_iterator(folder)) image[entry.path().filename()] = ReadFile(entry.path());
  return image;
}

void WriteFolder(const std::filesystem::path& folder, const FolderImage& image) {
  std::filesystem::remove_all(folder);
  std::filesystem::create_directories(folder);
  for (const auto& [name, bytes] : image) {
    std::ofstream file(folder / name, std::ios::binary);
    file.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    if (!file.flush()) throw std::runtime_error("cannot write " + (folder / name).string());
  }
}

DiskTrace::DiskTrace(FolderImage before, const std::filesystem::path& traceFile) : m_before(std::move(before)) {
  const std::string bytes = ReadFile(traceFile);
  for (std::size_t at = 0; at < bytes.size();) {
    TraceHeader header{};
    std::memcpy(&header, bytes.data() + at, sizeof header);
    at += sizeof header;
    DiskEntry entry{header.op, header.durable != 0, bytes.substr(at, header.nameSize), header.offset, {}};
    at += header.nameSize;
    entry.data = bytes.substr(at, header.size);
    at += header.size;
    m_entries.push_back(std::move(entry));
  }
}

std::optional<std::uint64_t> DiskTrace::MarkBefore(std::size_t point) const {
  for (std::size_t i = point; i-- > 0;) {
    if (m_entries[i].op == DiskOp::kMark) return m_entries[i].offset;
  }
  return std::nullopt;
}

FolderImage DiskTrace::After(std::size_t point, Survival survival, std::mt19937_64& random) const {
  Disk disk(m_before);
  for (std::size_t i = 0; i < point; ++i) disk.Play(m_entries[i]);
  if (point < m_entries.size()) {
    // Under way: a write that would be synced when it returns is not yet, and a sync has promised nothing.
    DiskEntry underWay = m_entries[point];
    underWay.durable = false;
    if (underWay.op != DiskOp::kSync && underWay.op != DiskOp::kSyncFolder) disk.Play(underWay);
    return disk.Survivors(survival, random);
  }
  return disk.Survivors(survival, random);
}

}  // namespace vemo::campaign
