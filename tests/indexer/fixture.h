#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "common/error.h"
#include "index/search/library.h"
#include "indexer/crawl/crawl.h"
#include "indexer/extract/processes.h"

namespace maru::indexer::test {

namespace fs = std::filesystem;

inline constexpr std::size_t kMaxText = 1u << 20;

/// The workers of all tests of this program; first asked for while there is one thread.
inline Workers& TheWorkers() {
  static extract::Processes processes(2);
  static Workers workers(processes, kMaxText);
  return workers;
}

/// What an entry is, in the index or on the disk.
struct Seen {
  bool is_dir = false;
  std::uint64_t size = 0;
  std::int64_t mtime = 0;
  uid_t owner = 0;

  friend bool operator==(const Seen&, const Seen&) = default;
  friend std::ostream& operator<<(std::ostream& out, const Seen& seen) {
    return out << (seen.is_dir ? "folder" : "file") << " size " << seen.size << " mtime "
               << seen.mtime << " owner " << seen.owner;
  }
};
using Snapshot = std::map<std::string, Seen>;

/// What only one of the two holds, or both differently.
inline std::string Differences(const Snapshot& expected, const Snapshot& actual) {
  std::ostringstream text;
  for (const auto& [path, seen] : expected) {
    const auto other = actual.find(path);
    if (other == actual.end()) {
      text << "missing: " << path << " (" << seen << ")\n";
    } else if (!(other->second == seen)) {
      text << path << ": " << other->second << " instead of " << seen << "\n";
    }
  }
  for (const auto& [path, seen] : actual) {
    if (!expected.contains(path)) text << "too much: " << path << " (" << seen << ")\n";
  }
  return text.str();
}

/// A share in a temporary folder, and its index.
class ShareTest : public testing::Test {
 protected:
  ShareTest() {
    TheWorkers();
    fs::create_directory(Share());
    fs::create_directory(root_ + "/index");
    chmod(root_.c_str(), 0755);
  }
  ~ShareTest() override {
    // Deeper trees than a path can name.
    EXPECT_EQ(0, std::system(("rm -rf " + root_).c_str()));
  }

  std::string Share() const { return root_ + "/share"; }
  std::string IndexFolder() const { return root_ + "/index/fileindex_share"; }

  void Write(const std::string& path, const std::string& text) {
    fs::create_directories(fs::path(Share() + "/" + path).parent_path());
    std::ofstream(Share() + "/" + path, std::ios::binary | std::ios::trunc) << text;
  }
  void Rename(const std::string& from, const std::string& to) {
    ASSERT_EQ(0, rename((Share() + "/" + from).c_str(), (Share() + "/" + to).c_str())) << from;
  }
  void Remove(const std::string& path) { fs::remove_all(Share() + "/" + path); }
  void Chmod(const std::string& path, mode_t mode) {
    ASSERT_EQ(0, chmod((Share() + "/" + path).c_str(), mode));
  }

  /// What changed within the current tick of the clock is compared once more.
  static void LetClockTick() { std::this_thread::sleep_for(std::chrono::milliseconds(25)); }

  struct Outcome {
    std::uint64_t added, changed, unchanged, removed, failed, unreadable, bytes;
  };
  Outcome Crawl() {
    LetClockTick();
    Counts counts;
    {
      Tree tree(IndexFolder(), counts, nullptr);
      Updater updater(tree, selection_, TheWorkers(), stop_);
      compared_ = indexer::Crawl(updater).Run(OpenTop(Share()).Get(), "share");
    }
    return {counts.added,  counts.changed,    counts.unchanged, counts.removed,
            counts.failed, counts.unreadable, counts.bytes};
  }
  /// Crawls and expects that nothing at all was to be done.
  void ExpectNothingToDo() {
    const Outcome outcome = Crawl();
    EXPECT_EQ(0u, outcome.added);
    EXPECT_EQ(0u, outcome.changed);
    EXPECT_EQ(0u, outcome.removed);
    EXPECT_EQ(0u, outcome.bytes);
  }

  std::unique_ptr<index::View> Read(const Identity& who = {0, {}, true}) {
    return library_.Open({"fileindex_share"}, who);
  }

  static std::vector<index::Hit> All(index::View& reader, const index::Query& query) {
    index::SearchOptions options;
    options.size = 1'000'000;
    return reader.Search(query, options).hits;
  }

  /// All that the index holds below the share's own folder, for these eyes. A path that it holds
  /// twice fails the test.
  Snapshot Indexed(const Identity& who = {0, {}, true}) {
    Snapshot snapshot;
    const auto reader = Read(who);
    for (const index::Hit& hit : All(*reader, {})) {
      if (hit.path.empty()) continue;
      const Seen seen{hit.record.is_dir, hit.record.size, hit.record.mtime, hit.owner};
      EXPECT_TRUE(snapshot.emplace(hit.path, seen).second) << "twice: " << hit.path;
    }
    return snapshot;
  }

  /// What lies on the disk; with `world` only what everybody may read and reach.
  Snapshot OnDisk(bool world = false) const {
    Snapshot snapshot;
    Add(snapshot, "", world);
    return snapshot;
  }

  /// False also while the first crawl is making the index.
  bool Matches() {
    try {
      return library_.Has("fileindex_share") && Indexed() == OnDisk();
    } catch (const maruseeker::Error&) {
      return false;
    }
  }

  std::set<std::string> Search(const std::string& word, std::string_view field = {}) {
    index::Query query;
    query.kind = index::Query::Kind::kWord;
    query.words = {word};
    query.fields = {{std::string(field.empty() ? "MARUMDTextContent" : field), 1}};
    std::set<std::string> paths;
    const auto reader = Read();
    for (const index::Hit& hit : All(*reader, query)) paths.insert(hit.path);
    return paths;
  }

  index::DocumentId DocumentOf(const std::string& path) {
    const auto hit = Read()->Find(0, path);
    return hit ? hit->document : 0;
  }

  /// The same changes each time; with --gtest_shuffle others.
  static std::mt19937 Random() {
    return std::mt19937(static_cast<unsigned>(testing::UnitTest::GetInstance()->random_seed()));
  }
  /// Some change to the tree, of every kind there is.
  void Mutate(std::mt19937& random);

  std::string root_ = [] {
    std::string path = testing::TempDir() + "maru_indexer_XXXXXX";
    return std::string(mkdtemp(path.data()));
  }();
  index::Library library_{root_ + "/index"};
  std::atomic<bool> stop_{false};
  Selection selection_;
  bool compared_ = false;

 private:
  void Add(Snapshot& snapshot, const std::string& folder, bool world) const {
    struct stat status {};
    if (lstat((Share() + folder).c_str(), &status) != 0) return;
    if (world && (status.st_mode & 1) == 0) return;
    for (const fs::directory_entry& entry : fs::directory_iterator(Share() + folder)) {
      const std::string path = folder + "/" + entry.path().filename().string();
      if (lstat(entry.path().c_str(), &status) != 0) continue;
      const bool is_dir = S_ISDIR(status.st_mode);
      if (!is_dir && !S_ISREG(status.st_mode)) continue;
      if (!world || (status.st_mode & 4) != 0) {
        snapshot[path] = {is_dir, is_dir ? 0 : static_cast<std::uint64_t>(status.st_size),
                          status.st_mtime, status.st_uid};
      }
      if (is_dir) Add(snapshot, path, world);
    }
  }
};

inline void ShareTest::Mutate(std::mt19937& random) {
  const Snapshot now = OnDisk();
  std::vector<std::string> files;
  std::vector<std::string> folders{""};
  for (const auto& [path, seen] : now) (seen.is_dir ? folders : files).push_back(path);
  const auto any = [&](const std::vector<std::string>& of) { return of[random() % of.size()]; };
  const std::string folder = Share() + any(folders);
  const std::string fresh = folder + "/n" + std::to_string(random() % 20);
  const std::string file = files.empty() ? fresh : Share() + any(files);
  std::error_code ignored;
  switch (random() % 9) {
    case 0:
    case 1:
      if (!fs::is_directory(fresh)) std::ofstream(fresh) << "word" << random() % 100 << " common";
      break;
    case 2:
      fs::create_directory(fresh, ignored);
      break;
    case 3:
      std::ofstream(file, std::ios::app) << " more" << random() % 100;
      break;
    case 4:
      fs::rename(file, fresh, ignored);
      break;
    case 5:
      if (folder != Share()) fs::rename(folder, Share() + any(folders) + "/m", ignored);
      break;
    case 6:
      fs::permissions(random() % 2 == 0 ? file : folder,
                      random() % 2 == 0 ? fs::perms(0700) : fs::perms(0755), ignored);
      break;
    case 7:
      fs::remove(file, ignored);
      break;
    default:
      if (folder != Share() && random() % 3 == 0) fs::remove_all(folder, ignored);
  }
}

}  // namespace maru::indexer::test
