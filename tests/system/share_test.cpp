#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "system/indexed_shares.h"
#include "system/share_access.h"
#include "system/share_parameters.h"
#include "system/share_table.h"
#include "system/way.h"
#include "tests/support/support.h"

namespace {

using namespace maru;
using testing::ElementsAre;
using testing::HasSubstr;

std::vector<std::string> Names(const ShareTable& table) {
  std::vector<std::string> names;
  for (const ShareSettings& share : table.Shares()) names.push_back(share.name);
  return names;
}

std::string ErrorOf(const std::string& text) {
  try {
    ShareTable::Parse(text);
    return "none";
  } catch (const std::runtime_error& error) {
    return error.what();
  }
}

TEST(ShareTable, ReadsTheCanonicalForm) {
  const ShareTable table = ShareTable::Parse(R"(# Global parameters
[global]
	workgroup = X
	hide unreadable = Yes
	maruseeker:index = no

[Photo Album]
	path = /mnt/photo/
	hide unreadable = No
	read only = No
	valid users = alice @work "+Domain Users", ; bob
	vfs objects = audit recycle
	maruseeker:deny = list read
	maruseeker:index = yes
[service]
	path = /srv/%S
[each]
	path = /srv/%U/files
[printers]
	path = /tmp
[lp]
	path = /tmp
	printable = Yes
[empty]
	available = No
)");
  EXPECT_THAT(Names(table), ElementsAre("Photo Album", "each", "service"));
  const ShareSettings& photo = *table.Find("Photo Album");
  EXPECT_EQ(photo.path, "/mnt/photo");
  EXPECT_EQ(photo.VolumePath(), "/volume1/Photo Album");
  EXPECT_THAT(photo.valid_users, ElementsAre("alice", "@work", "+Domain Users", "bob"));
  EXPECT_TRUE(photo.recycle && photo.index && !photo.hide_unreadable && !photo.read_only);
  EXPECT_EQ(photo.deny, 5u);
  EXPECT_EQ(table.Find("service")->path, "/srv/service");
  EXPECT_EQ(table.Find("photo album"), nullptr);
  const ShareSettings& each = *table.Find("each");
  EXPECT_TRUE(each.read_only && each.hide_unreadable && !each.index);  // from [global]
  EXPECT_EQ(each.path, "/srv");
  EXPECT_TRUE(each.personal && each.personal->own_only && !each.personal->by_home);
  EXPECT_EQ(each.personal->inside, "/files");
}

TEST(ShareTable, NamesTheBadLine) {
  EXPECT_THAT(ErrorOf("[a]\n\tpath = /a\n\tnonsense\n"), HasSubstr("line 3: \"nonsense\""));
  EXPECT_THAT(ErrorOf("path = /a\n"), HasSubstr("line 1"));
  EXPECT_THAT(ErrorOf("[a\n"), HasSubstr("line 1"));
}

TEST(ShareTable, WithholdsABadShareAlone) {
  const std::pair<std::string, std::string> bad[] = {
      {"path = relative", "relative is not absolute"},
      {"path = /srv/%m", "client"},
      {"path = /srv/%U-files", "client"},
      {"available = perhaps", "yes or no"},
      {"maruseeker:deny = all", "list read"},
      {"vfs objects = recycle acl_xattr", "acl_xattr"},
      {"vfs objects = acl_tdb", "acl_tdb"},
      {"veto files = /%U/", "each user"},
      {"veto files = /a<b/", "<"},
      {"preexec = x\nroot preexec = x\nroot preexec close = yes", "preexec"},
      {"hosts deny = box", "address"},
      {"hosts allow = ALL EXCEPT .example.org", "address"},
      {"include = /etc/%m.conf", "each client"},
      {"valid users = %g", "variable"},
      {"invalid users = S-1-5-32-544", "no account"},
      {"force user = OTHER\\alice", "plainly"},
      {"guest only = yes\nforce user = bin", "guests"},
      {"force user = nobody", "nobody's account"},
      {"guest account = bin\nforce user = bin", "nobody's account"},
      {"path = /srv/%U\nadmin users = bin", "another's rights"},
  };
  for (const auto& [lines, why] : bad) {
    const ShareTable table = ShareTable::Parse("[a]\npath = /a\n[b]\npath = /b\n" + lines);
    EXPECT_THAT(Names(table), ElementsAre("a")) << lines;
    ASSERT_EQ(table.Withheld().size(), 1u) << lines;
    EXPECT_EQ(table.Withheld()[0].name, "b");
    EXPECT_THAT(table.Withheld()[0].reason, HasSubstr(why));
  }
  const std::string all = "[global]\nvfs objects = acl_xattr\nhosts allow = ALL\n";
  EXPECT_THAT(Names(ShareTable::Parse(all + "[a]\npath=/a\n[b]\npath=/b\nvfs objects =\n")),
              ElementsAre("b"));
  EXPECT_THAT(Names(ShareTable::Parse("[a]\npath=/a\n[A]\npath=/b\n[c]\npath=/c\n")),
              ElementsAre("c"));
  for (const std::string name : {"..", ".", "", "a/b", "a\x01"}) {
    EXPECT_THAT(Names(ShareTable::Parse("[" + name + "]\npath=/a\n")), ElementsAre()) << name;
  }
  EXPECT_THAT(Names(ShareTable::Parse("[" + std::string(300, 'a') + "]\npath=/a")), ElementsAre());
}

TEST(ShareTable, KnowsWhoseFoldersAreWhose) {
  NEEDS_ACCOUNTS();
  const ShareTable by_home = ShareTable::Parse("[homes]\nvalid users = %S\n");
  const ShareSettings& homes = *by_home.Find("homes");
  EXPECT_EQ(homes.path, "/mnt/homes");  // where the sandbox's people live
  EXPECT_TRUE(Serves(homes, "alice", "/alice/a.txt"));
  for (const std::string path : {"", "/bob/a.txt", "/nobody here", "/root"}) {
    EXPECT_FALSE(Serves(homes, "alice", path)) << path;
  }
  const ShareTable any = ShareTable::Parse("[homes]\npath = /srv/%S/a/b\nveto files = /x/\n");
  EXPECT_TRUE(Serves(*any.Find("homes"), "alice", "/bob/a/b/c"));
  for (const std::string path : {"/bob", "/bob/a", "/bob/a/c", "/x/a/b", "/bob/a/b/c/x/d"}) {
    EXPECT_FALSE(Serves(*any.Find("homes"), "alice", path)) << path;
  }
  const std::string admits_others = "[homes]\npath = /srv/%S\nvalid users = %S @family\n";
  EXPECT_TRUE(ShareTable::Parse(admits_others).IsWithheld("homes"));
  EXPECT_NE(CrawlTermsOf(homes), CrawlTermsOf(*any.Find("homes")));
}

TEST(VetoPatterns, MatchAsSambaDoes) {
  const auto matches = [](const std::string& value, const std::string& path, bool exact = false) {
    return VetoPatterns{VetoPatterns::Split(value), exact}.MatchAny(path);
  };
  for (const std::string path : {"/a/D1/b", "/ferry", "/a/dx"}) {
    EXPECT_TRUE(matches("/d*/f*/", path)) << path;
    EXPECT_EQ(matches("/d*/f*/", path, true), path != "/a/D1/b") << path;
  }
  EXPECT_TRUE(matches("lone", "/a/LONE"));
  EXPECT_TRUE(matches("/*x*.b?k/", "/axa.bak"));
  EXPECT_TRUE(matches("/übung*/", "/ÜBUNGEN"));
  EXPECT_TRUE(matches("/\xff?/", "/\xffz"));
  for (const std::string path : {"/a/e", "/axa.bk", "/afoo", "/ubung", ""}) {
    EXPECT_FALSE(matches("/d*/f*/*x*.b?k/übung*/", path)) << path;
  }
}

ShareAccess Access(const std::string& lines, const std::string& user = "alice") {
  const ShareTable table =
      ShareTable::Parse("[global]\nnetbios name = BOX\n[photo]\npath = /a\n" + lines);
  if (table.Shares().empty()) return {};
  return AccessOf(table.Shares()[0], user, IdentityOfUser(user).value());
}

int Privilege(const std::string& lines) {
  return Access(lines).privilege;
}

TEST(ShareAccess, FollowsSambasOrder) {
  NEEDS_ACCOUNTS();
  EXPECT_EQ(Privilege(""), kSharePrivReadOnly);  // Samba's default
  EXPECT_EQ(Privilege("read only = no"), kSharePrivReadWrite);
  EXPECT_EQ(Privilege("available = no"), kSharePrivNone);
  EXPECT_EQ(Privilege("valid users = bob"), kSharePrivNone);
  EXPECT_EQ(Privilege("valid users = bob, ALICE"), kSharePrivReadOnly);
  EXPECT_EQ(Privilege("valid users = alice\ninvalid users = alice"), kSharePrivNone);
  EXPECT_EQ(Privilege("read only = no\nread list = alice"), kSharePrivReadOnly);
  EXPECT_EQ(Privilege("read list = alice\nwrite list = alice"), kSharePrivReadWrite);
  EXPECT_EQ(Privilege("valid users = bob\nwrite list = alice"), kSharePrivNone);
}

TEST(ShareAccess, KnowsNamesAndVariables) {
  NEEDS_ACCOUNTS();
  for (const std::string entry :
       {"@family", "+family", "+&family", "&+family", "\"@family\"", "+\"family\"", "@alice", "%U",
        "%u", "box\\alice", "\"unix user\\alice\"", "@\"Unix Group\\family\"", "+BOX\\family",
        "S-1-22-1-60001", "s-1-22-2-60101"}) {
    EXPECT_EQ(Privilege("valid users = " + entry), kSharePrivReadOnly) << entry;
    EXPECT_EQ(Privilege("invalid users = " + entry), kSharePrivNone) << entry;
  }
  for (const std::string entry :
       {"family", "&family", "@work", "@Family", "@no such group", "alic", "alice2", "%S", "@", "%",
        "*", "60001", "WORKGROUP\\alice", "\"Unix Group\\family\"", "S-1-22-1-60002", "S-1-22-1-",
        "S-1-22-3-60001"}) {
    EXPECT_EQ(Privilege("valid users = " + entry), kSharePrivNone) << entry;
  }
}

TEST(ShareAccess, PutsOthersInTheUsersPlace) {
  NEEDS_ACCOUNTS();
  const Identity own = IdentityOfUser("alice").value();
  const Identity bob = IdentityOfUser("bob").value();
  EXPECT_EQ(Access("").identity, own);
  EXPECT_EQ(Access("force user = bob").identity, bob);
  EXPECT_FALSE(Access("force user = MaruSeeker").identity.unrestricted);
  EXPECT_FALSE(Access("force user = no such").Admits());
  EXPECT_FALSE(Access("force user = bob\nvalid users = bob").Admits());
  EXPECT_FALSE(Access("force group = @work").Admits());
  EXPECT_TRUE(Access("force group = work").identity.InGroup(60102));
  EXPECT_EQ(Access("force group = +work").identity, own);
  EXPECT_FALSE(Access("force user = carol\nforce group = +work").Admits());
  EXPECT_FALSE(Access("guest only = yes\nforce group = +work").Admits());
  EXPECT_EQ(Access("guest only = yes").identity.uid, IdentityOfUser("nobody").value().uid);
  EXPECT_TRUE(Access("force user = bob\nadmin users = alice").identity.unrestricted);
  EXPECT_FALSE(Access("admin users = alice\ninvalid users = alice").Admits());
  EXPECT_EQ(
      AccessOf(ShareTable::Parse("[homes]\nadmin users = %S\n").Shares()[0], "alice", own).identity,
      own);
}

TEST(Way, IsOpenToWhoCanCrossEveryFolder) {
  NEEDS_ACCOUNTS();
  const TempFolder folder;
  std::filesystem::create_directories(folder / "closed/share");
  std::filesystem::create_directories(folder / "family/share");
  const Identity alice = IdentityOfUser("alice").value();
  const Identity bob = IdentityOfUser("bob").value();
  EXPECT_TRUE(CanReach(bob, folder / "closed/share"));
  ASSERT_EQ(chmod((folder / "closed").c_str(), 0700), 0);
  ASSERT_EQ(chown((folder / "family").c_str(), 0, 60101), 0);
  ASSERT_EQ(chmod((folder / "family").c_str(), 0710), 0);
  ASSERT_EQ(symlink("family/../closed/share", (folder / "link").c_str()), 0);
  ASSERT_EQ(symlink((folder / "family").c_str(), (folder / "absolute").c_str()), 0);
  ASSERT_EQ(symlink("loop", (folder / "loop").c_str()), 0);
  EXPECT_FALSE(CanReach(alice, folder / "closed/share"));
  EXPECT_TRUE(CanReach(alice, folder / "family//./share/"));
  EXPECT_FALSE(CanReach(bob, folder / "family/share"));
  EXPECT_FALSE(CanReach(alice, folder / "link"));
  EXPECT_TRUE(CanReach(alice, folder / "absolute/share"));
  EXPECT_FALSE(CanReach(bob, folder / "absolute/share"));
  EXPECT_FALSE(CanReach(alice, folder / "loop"));
  EXPECT_TRUE(CanReach(alice, folder / "gone/share"));
  EXPECT_TRUE(CanReach({0, {}, true}, folder / "closed/share"));
}

/// docs/configuration.md prints the table.
TEST(ShareParameters, AreDocumented) {
  const std::string document = FileText(MARU_SOURCE "/docs/configuration.md");
  for (const ShareParameter& parameter : ShareParameters()) {
    const std::string row =
        "| `" + std::string(parameter.name) + "` | " + std::string(parameter.meaning) + " |";
    EXPECT_THAT(document, HasSubstr(row));
  }
}

/// With Samba's own program, where it is installed.
class Samba : public testing::Test {
 protected:
  void SetUp() override {
    if (access("/usr/bin/testparm", X_OK) != 0) GTEST_SKIP() << "needs testparm";
    Write("[photo]\npath = /mnt/photo\n");
    Configure(folder_);
  }
  void Write(const std::string& text) {
    folder_.Write("smb.conf.new", text);
    std::filesystem::rename(folder_ / "smb.conf.new", folder_ / "smb.conf");
  }
  TempFolder folder_;
};

TEST_F(Samba, SettingsAreReadThroughTestparm) {
  folder_.Write("included", "[docs]\ncomment = a\npath = /mnt/docs\nwriteable = yes\n");
  Write(
      "[global]\nvalid users = @family\nhide unreadable = yes\n[photo]\npath = /mnt/photo\n"
      "valid users = alice, \"@Domain Users\"\ninclude = " +
      (folder_ / "included") + "\n[homes]\n[printers]\npath = /tmp\nprintable = yes\n[no path]\n");
  const auto table = ShareTable::Current();
  EXPECT_EQ(table->Error(), "");
  EXPECT_THAT(Names(*table), ElementsAre("docs", "homes", "photo"));
  EXPECT_TRUE(table->IsWithheld("no path"));
  EXPECT_THAT(table->Find("photo")->valid_users, ElementsAre("alice", "@Domain Users"));
  EXPECT_TRUE(table->Find("photo")->hide_unreadable);
  EXPECT_THAT(table->Find("docs")->valid_users, ElementsAre("@family"));
  EXPECT_FALSE(table->Find("docs")->read_only);
  EXPECT_TRUE(table->Find("homes")->personal->by_home);
  EXPECT_EQ(ShareTable::Current(), table);
}

TEST_F(Samba, WithholdsWhatTestparmRefuses) {
  std::string text = "[global]\nhide unreadable = yes\n";
  for (const std::string name : {"a", "b", "c", "d", "e"}) {
    text += "[" + name + "]\npath = /mnt/" + name + "\n";
    if (name == "b" || name == "e") text += "read only = perhaps\n";
  }
  Write(text);
  const auto table = ShareTable::Current();
  EXPECT_EQ(table->Error(), "");
  EXPECT_THAT(Names(*table), ElementsAre("a", "c", "d"));
  ASSERT_EQ(table->Withheld().size(), 2u);
  EXPECT_EQ(table->Withheld()[1].name, "e");
  EXPECT_THAT(table->Withheld()[1].reason, HasSubstr("perhaps"));
}

TEST_F(Samba, WithholdsWhatTestparmDoesNotShow) {
  folder_.Write("included", "[docs]\npath = /mnt/docs\nInClude =\\\n /etc/%m.conf\n");
  std::filesystem::create_directory(folder_ / "samba");
  Write("[global]\nstate directory = " + (folder_ / "samba") +
        "\n[Photo]\npath = /mnt/photo\ninclude = " + (folder_ / "included") +
        "\n[twin]\ncopy = docs\n[free]\npath = /free\n");
  const auto table = ShareTable::Current();
  EXPECT_THAT(Names(*table), ElementsAre("Photo", "free"));
  EXPECT_TRUE(table->IsWithheld("docs") && table->IsWithheld("twin"));
  const std::string acl =
      "sharesec -s " + (folder_ / "smb.conf") + " Photo -a S-1-1-0:DENIED/0/FULL > /dev/null 2>&1";
  if (system("command -v sharesec > /dev/null") != 0) GTEST_SKIP() << "needs sharesec";
  ASSERT_EQ(system(acl.c_str()), 0);
  ASSERT_EQ(utimensat(AT_FDCWD, (folder_ / "smb.conf").c_str(), nullptr, 0), 0);
  EXPECT_THAT(Names(*ShareTable::Current()), ElementsAre("free"));
}

TEST_F(Samba, BadSettingsLeaveTheLastGoodOnes) {
  ASSERT_EQ(ShareTable::Current()->Error(), "");
  Write("[global]\nread only = perhaps\n[photo]\npath = /mnt/photo\n[new]\npath=/new\n");
  const auto table = ShareTable::Current();
  EXPECT_THAT(table->Error(), HasSubstr("perhaps"));
  EXPECT_THAT(Names(*table), ElementsAre("photo"));
  Write("[new]\npath = /new\n");
  EXPECT_THAT(Names(*ShareTable::Current()), ElementsAre("new"));
  EXPECT_EQ(ShareTable::Current()->Error(), "");
  unlink((folder_ / "smb.conf").c_str());
  EXPECT_THAT(Names(*ShareTable::Current()), ElementsAre("new"));
  EXPECT_NE(ShareTable::Current()->Error(), "");
}

TEST_F(Samba, BadSettingsAtTheStartBringTheCopyBack) {
  NEEDS_ACCOUNTS();
  Write("[global]\nread only = perhaps\n");
  if (StatusOfChild([] { _exit(ShareTable::Current()->Shares().empty() ? 0 : 1); }) != 0) {
    GTEST_SKIP() << "needs a process that has read no settings yet";
  }
  Write("[photo]\npath = /mnt/photo\n");
  ASSERT_EQ(StatusOfChild([] { EXPECT_EQ(ShareTable::Current()->Error(), ""); }), 0);
  struct stat status;
  ASSERT_EQ(stat((folder_ / "state/shares.conf").c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 60000u);
  Write("[global]\nread only = perhaps\n");
  // Another program: nothing in memory.
  EXPECT_EQ(StatusOfChild([] {
              const auto table = ShareTable::Current();
              EXPECT_NE(table->Error(), "");
              EXPECT_THAT(Names(*table), ElementsAre("photo"));
            }),
            0);
}

TEST_F(Samba, FrozenTablesLookAtNoFile) {
  EXPECT_EQ(StatusOfChild([this] {
              const auto table = ShareTable::Current();
              ShareTable::Freeze();
              Write("[new]\npath = /new\n");
              EXPECT_EQ(ShareTable::Current(), table);
            }),
            0);
}

}  // namespace
