#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "system/share_table.h"
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

[homes]
	path = /data/homes/%S/files
	valid users = %S

[Photo Album]
	path = /mnt/photo/
	hide unreadable = No
	read only = No
	valid users = alice @work "+Domain Users", ; bob
	vfs objects = acl_xattr recycle
	maruseeker:deny = list read
	maruseeker:index = yes
[service]
	path = /srv/%S
[each]
	path = /srv/%U
[printers]
	path = /tmp
[lp]
	path = /tmp
	printable = Yes
[empty]
	available = No
)");
  EXPECT_THAT(Names(table), ElementsAre("Photo Album", "homes", "service"));
  const ShareSettings& photo = *table.Find("Photo Album");
  EXPECT_EQ(photo.path, "/mnt/photo");
  EXPECT_EQ(photo.VolumePath(), "/volume1/Photo Album");
  EXPECT_THAT(photo.valid_users, ElementsAre("alice", "@work", "+Domain Users", "bob"));
  EXPECT_TRUE(photo.recycle && photo.index && !photo.hide_unreadable && !photo.read_only);
  EXPECT_EQ(photo.deny, 5u);
  const ShareSettings& homes = *table.Find("homes");
  EXPECT_EQ(homes.path, "/data/homes");
  EXPECT_TRUE(homes.read_only && homes.hide_unreadable && !homes.index);  // from [global]
  EXPECT_EQ(table.Find("service")->path, "/srv/service");
  EXPECT_EQ(table.Find("photo album"), nullptr);
  EXPECT_EQ(ShareTable::Parse("[homes]\n").Find("homes")->path, "/home");
}

TEST(ShareTable, NamesTheBadLine) {
  EXPECT_THAT(ErrorOf("[a]\n\tpath = /a\n\tnonsense\n"), HasSubstr("line 3: \"nonsense\""));
  EXPECT_THAT(ErrorOf("path = /a\n"), HasSubstr("line 1"));
  EXPECT_THAT(ErrorOf("[a\n"), HasSubstr("line 1"));
  EXPECT_THAT(ErrorOf("[a]\n\tread only = perhaps\n"), HasSubstr("yes or no"));
  EXPECT_THAT(ErrorOf("[a]\n\tmaruseeker:deny = all\n"), HasSubstr("list read"));
  EXPECT_THAT(ErrorOf("[a]\n\tpath = relative\n"), HasSubstr("absolute"));
  EXPECT_THAT(ErrorOf("[a]\npath=/a\n[A]\npath=/b\n"), HasSubstr("second section"));
  for (const std::string name : {"..", ".", "", "a/b", "a\x01"}) {
    EXPECT_THAT(ErrorOf("[" + name + "]\n"), HasSubstr("no name of a share")) << name;
  }
  EXPECT_THAT(ErrorOf("[" + std::string(300, 'a') + "]\n"), HasSubstr("no name of a share"));
}

int Privilege(const std::string& lines, const std::string& user = "alice") {
  const ShareTable table = ShareTable::Parse("[photo]\npath = /a\n" + lines);
  return PrivilegeOf(table.Shares().front(), user, IdentityOfUser(user).value());
}

TEST(SharePrivilege, FollowsSambasOrder) {
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

TEST(SharePrivilege, KnowsGroupsAndVariables) {
  NEEDS_ACCOUNTS();
  for (const std::string entry : {"@family", "+family", "+&family", "&+family", "\"@family\"",
                                  "+\"family\"", "@alice", "%U", "%u"}) {
    EXPECT_EQ(Privilege("valid users = " + entry), kSharePrivReadOnly) << entry;
    EXPECT_EQ(Privilege("invalid users = " + entry), kSharePrivNone) << entry;
  }
  for (const std::string entry :
       {"family", "&family", "@work", "@no such group", "alic", "alice2", "%S", "@", "%"}) {
    EXPECT_EQ(Privilege("valid users = " + entry), kSharePrivNone) << entry;
  }
  // Who cannot be told stays outside, on whichever list it stands.
  EXPECT_EQ(Privilege("valid users = %D%w%U"), kSharePrivNone);
  EXPECT_EQ(Privilege("invalid users = %D%w%U"), kSharePrivNone);
  const ShareTable table = ShareTable::Parse("[homes]\nvalid users = %S, %D%w%S\n");
  EXPECT_EQ(PrivilegeOf(table.Shares().front(), "alice", {60001, {60001}}), kSharePrivReadOnly);
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
  EXPECT_THAT(table->Find("photo")->valid_users, ElementsAre("alice", "@Domain Users"));
  EXPECT_TRUE(table->Find("photo")->hide_unreadable);
  EXPECT_THAT(table->Find("docs")->valid_users, ElementsAre("@family"));
  EXPECT_FALSE(table->Find("docs")->read_only);
  EXPECT_EQ(table->Find("homes")->path, "/home");
  EXPECT_EQ(ShareTable::Current(), table);
}

TEST_F(Samba, BadSettingsLeaveTheLastGoodOnes) {
  ASSERT_EQ(ShareTable::Current()->Error(), "");
  Write("[photo]\npath = /mnt/photo\nread only = perhaps\n[new]\npath=/new\n");
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
  Write("[photo\n");
  if (StatusOfChild([] { _exit(ShareTable::Current()->Shares().empty() ? 0 : 1); }) != 0) {
    GTEST_SKIP() << "needs a process that has read no settings yet";
  }
  Write("[photo]\npath = /mnt/photo\n");
  ASSERT_EQ(StatusOfChild([] { EXPECT_EQ(ShareTable::Current()->Error(), ""); }), 0);
  struct stat status;
  ASSERT_EQ(stat((folder_ / "state/shares.conf").c_str(), &status), 0);
  EXPECT_EQ(status.st_uid, 60000u);
  Write("[photo]\nread only = perhaps\n");
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
