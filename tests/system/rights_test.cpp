#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/xattr.h>

#include <array>
#include <random>

#include "system/rights_cache.h"
#include "system/share_table.h"
#include "tests/support/support.h"

namespace {

using maru::FileRights;
using maru::Identity;

constexpr const char* kAttribute = "system.posix_acl_access";
enum Tag { kUserObject = 1, kUser = 2, kGroupObject = 4, kGroup = 8, kMask = 16, kOther = 32 };

struct Entry {
  std::uint16_t tag;
  std::uint16_t bits;
  std::uint32_t id = ~0u;
};

std::string Raw(const std::vector<Entry>& entries) {
  std::string raw("\2\0\0\0", 4);
  for (const Entry& entry : entries) raw.append(reinterpret_cast<const char*>(&entry), 8);
  return raw;
}

std::vector<Identity> Users() {
  std::vector<Identity> users;
  for (const char* name : {"alice", "bob", "carol"}) {
    users.push_back(maru::IdentityOfUser(name).value());
  }
  // Of many groups and of none, known to no name service.
  users.push_back({61001, {60001, 60101, 60102, 61001}});
  users.push_back({61002, {61002}});
  return users;
}

void Become(const Identity& who) {
  ASSERT_EQ(setgroups(who.groups.size(), who.groups.data()), 0);
  ASSERT_EQ(setresgid(who.groups[0], who.groups[0], who.groups[0]), 0);
  ASSERT_EQ(setresuid(who.uid, who.uid, who.uid), 0);
}

/// What the kernel says to a process that really is that user, path after path.
std::vector<char> KernelsAnswers(const Identity& who, const std::vector<std::string>& paths) {
  int ends[2];
  EXPECT_EQ(pipe(ends), 0);
  EXPECT_EQ(StatusOfChild([&] {
              Become(who);
              std::vector<char> answers;
              for (const std::string& path : paths) {
                int bits = 0;
                const int reading = open(path.c_str(), O_RDONLY | O_CLOEXEC);
                const int writing = open(path.c_str(), O_WRONLY | O_CLOEXEC);
                if (reading >= 0) bits |= kACLRead;
                if (writing >= 0) bits |= kACLWrite;
                if (faccessat(AT_FDCWD, path.c_str(), X_OK, AT_EACCESS) == 0) bits |= kACLExecute;
                close(reading);
                close(writing);
                answers.push_back(static_cast<char>(bits));
              }
              EXPECT_EQ(write(ends[1], answers.data(), answers.size()), ssize_t(answers.size()));
            }),
            0);
  std::vector<char> answers(paths.size());
  EXPECT_EQ(read(ends[0], answers.data(), answers.size()), ssize_t(answers.size()));
  close(ends[0]);
  close(ends[1]);
  return answers;
}

class RandomRights {
 public:
  void GiveTo(const std::string& path) {
    const uid_t owners[] = {0, 60001, 60002, 60003, 61001};
    EXPECT_EQ(chown(path.c_str(), Of(owners), Of(groups_)), 0);
    EXPECT_EQ(chmod(path.c_str(), static_cast<mode_t>(Below(0777 + 1))), 0);
    if (Below(4) == 0) return;
    const std::string acl = Acl();
    EXPECT_EQ(setxattr(path.c_str(), kAttribute, acl.data(), acl.size(), 0), 0) << errno;
  }
  unsigned Below(unsigned n) { return std::uniform_int_distribution<unsigned>(0, n - 1)(random_); }

 private:
  template <class T, std::size_t N>
  T Of(const T (&items)[N]) {
    return items[Below(N)];
  }
  Entry New(Tag tag) {
    return {static_cast<std::uint16_t>(tag), static_cast<std::uint16_t>(Below(8))};
  }
  /// Some of the ids, each with bits, in the order that the kernel demands.
  void Append(std::vector<Entry>& entries, Tag tag, const std::vector<std::uint32_t>& ids) {
    for (const std::uint32_t id : ids) {
      if (Below(3) != 0) continue;
      entries.push_back(New(tag));
      entries.back().id = id;
    }
  }
  std::string Acl() {
    std::vector<Entry> entries{New(kUserObject)};
    Append(entries, kUser, {60001, 60002, 61001, 61002});
    entries.push_back(New(kGroupObject));
    Append(entries, kGroup, {60001, 60100, 60101, 60102, 61002});
    const Entry mask{kMask, static_cast<std::uint16_t>(Below(4) ? Below(8) : 0)};
    if (entries.size() > 2 || Below(2)) entries.push_back(mask);
    entries.push_back(New(kOther));
    return Raw(entries);
  }

  static constexpr gid_t groups_[] = {0, 60001, 60101, 60102, 61001};
  std::mt19937 random_{20};
};

TEST(Rights, AreTheKernels) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  RandomRights random;
  std::vector<std::string> paths;
  for (int i = 0; i < 800; ++i) {
    paths.push_back(folder.Write("file" + std::to_string(i), ""));
    random.GiveTo(paths.back());
  }
  // As a person sets them.
  paths.push_back(folder.Write("by hand", ""));
  ASSERT_EQ(system(("setfacl -m u:alice:rw,g:work:r,m::r '" + paths.back() + "'").c_str()), 0);
  for (const Identity& who : Users()) {
    const std::vector<char> answers = KernelsAnswers(who, paths);
    for (std::size_t i = 0; i < paths.size(); ++i) {
      FileRights rights;
      ASSERT_TRUE(maru::ReadFileRights(AT_FDCWD, paths[i].c_str(), rights));
      EXPECT_EQ(maru::RightsOf(who, rights), answers[i])
          << who.uid << " on " << std::oct << rights.uid << ":" << rights.gid << " " << rights.mode
          << " with an ACL of " << std::dec << rights.acl.size() << " bytes";
    }
  }
}

TEST(Rights, OfAMalformedACLAreNone) {
  const Identity who{60001, {60001}};
  FileRights rights{0, 0, 0777, Raw({{kUserObject, 7}, {kGroupObject, 7}, {kOther, 7}})};
  EXPECT_EQ(maru::RightsOf(who, rights), 7);
  const std::string good = rights.acl;
  for (std::size_t size = 1; size < good.size(); ++size) {
    rights.acl = good.substr(0, size);
    EXPECT_EQ(maru::RightsOf(who, rights), 0) << size;
  }
  rights.acl = good;
  rights.acl[0] = 3;  // another version
  EXPECT_EQ(maru::RightsOf(who, rights), 0);
  rights.acl = Raw({{kUserObject, 7}, {0x40, 7}, {kOther, 7}});
  EXPECT_EQ(maru::RightsOf(who, rights), 0);
}

TEST(Rights, ReadingThemFollowsNoLink) {
  const TempFolder folder;
  const std::string file = folder.Write("file", "");
  chmod(file.c_str(), 0640);
  EXPECT_EQ(symlink(file.c_str(), (folder / "link").c_str()), 0);
  const int directory = open((folder / "").c_str(), O_RDONLY | O_DIRECTORY);
  FileRights rights;
  ASSERT_TRUE(maru::ReadFileRights(directory, "file", rights));
  EXPECT_EQ(rights.mode, 0640);
  ASSERT_TRUE(maru::ReadFileRights(directory, "link", rights));
  EXPECT_EQ(rights.mode, 0777);
  ASSERT_TRUE(maru::ReadFileRights(directory, "", rights));
  EXPECT_EQ(rights.mode, 0755);
  EXPECT_FALSE(maru::ReadFileRights(directory, "none", rights));
  EXPECT_EQ(errno, ENOENT);
  close(directory);
}

TEST(Rights, RememberedOnesAreThoseOfNow) {
  const TempFolder folder;
  const std::string file = folder.Write("file", "");
  const int directory = open((folder / "").c_str(), O_RDONLY | O_DIRECTORY);
  constexpr time_t kAtOnce = -1000;
  maru::RightsCache cache(kAtOnce);
  FileRights known, now;
  struct stat seen {};
  const auto agree = [&](const char* path) {
    EXPECT_TRUE(cache.Read(directory, path, known, seen));
    EXPECT_TRUE(maru::ReadFileRights(directory, path, now));
    return known == now;
  };
  const auto change_time = [&] {
    struct stat status {};
    stat(file.c_str(), &status);
    return std::pair(status.st_ctim.tv_sec, status.st_ctim.tv_nsec);
  };
  const std::string acls[] = {
      "", Raw({{kUserObject, 6}, {kUser, 4, 60001}, {kGroupObject, 4}, {kMask, 4}, {kOther, 0}})};
  for (int round = 0; round < 6; ++round) {
    ASSERT_TRUE(agree("file")) << round;
    ASSERT_TRUE(agree("file")) << round;
    const auto before = change_time();
    const std::string& acl = acls[(round + 1) % 2];
    do {
      if (acl.empty()) {
        removexattr(file.c_str(), "system.posix_acl_access");
        chmod(file.c_str(), 0600);
      } else if (setxattr(file.c_str(), "system.posix_acl_access", acl.data(), acl.size(), 0) !=
                 0) {
        GTEST_SKIP() << "needs a file system with ACLs";
      }
    } while (change_time() == before);
  }
  folder.Write("other", "");
  chmod((folder / "other").c_str(), 0604);
  ASSERT_EQ(rename((folder / "other").c_str(), file.c_str()), 0);
  EXPECT_TRUE(agree("file"));
  EXPECT_EQ(known.mode, 0604);
  unlink(file.c_str());
  EXPECT_FALSE(cache.Read(directory, "file", known, seen));
  EXPECT_EQ(errno, ENOENT);
  close(directory);
}

}  // namespace
