#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdio.h>

#include <fstream>
#include <random>

#include "system/client_address.h"
#include "system/share_table.h"
#include "tests/support/support.h"

namespace {

using maru::ClientAddress;
using maru::ShareSettings;
using maru::ShareTable;
using testing::HasSubstr;

/// From which of 127.0.0.1, 127.0.0.2, 192.168.7.9, ::1 and 2001:db8::9 one enters, and whether
/// with an address that is not known: "+" or "-" for each. Empty when the share is withheld.
std::string EnteredFrom(const std::string& rules) {
  const ShareTable table = ShareTable::Parse("[a]\npath = /a\n" + rules + "\n");
  const ShareSettings* share = table.Find("a");
  std::string from;
  for (const std::string address :
       {"127.0.0.1", "127.0.0.2", "192.168.7.9", "::1", "2001:db8::9", "unknown"}) {
    if (share) from += share->IsOpenTo(ClientAddress(address)) ? '+' : '-';
  }
  return from;
}

TEST(ClientAddress, IsWrittenInOneWay) {
  for (const auto& [given, written] :
       std::initializer_list<std::pair<std::string, std::string>>{{"192.0.2.7", "192.0.2.7"},
                                                                  {"::ffff:192.0.2.7", "192.0.2.7"},
                                                                  {"2001:DB8:0::7", "2001:db8::7"},
                                                                  {"fe80::1%eth0", "fe80::1"},
                                                                  {"", ""},
                                                                  {"unknown", ""},
                                                                  {"192.0.2.7:80", ""},
                                                                  {"192.0.2.7 ", ""},
                                                                  {"192.0.2", ""}}) {
    EXPECT_EQ(ClientAddress(given).Text(), written) << given;
  }
  EXPECT_EQ(ClientAddress().Text(), "");
}

TEST(HostRules, DecideByTheAddress) {
  for (const auto& [rules, from] : std::initializer_list<std::pair<std::string, std::string>>{
           {"", "++++++"},
           {"hosts allow = all", "++++++"},
           {"hosts allow = ALL\nhosts deny = .example.org, @group", "++++++"},
           {"hosts deny = ALL", "------"},
           {"hosts deny = 127.0.0.1", "-++++-"},
           {"hosts deny = 127.", "--+++-"},
           {"hosts deny = localhost", "+++++-"},
           {"hosts deny = ALL\nhosts allow = 127.0.0.1", "+-----"},
           {"hosts deny = 127.\nhosts allow = 127.", "+++++-"},
           {"hosts allow = 192.168.", "+-++--"},
           {"hosts allow = 192.168., 2001:db8::9; 127.0.0.2 localhost", "+++++-"},
           {"hosts allow = 2001:DB8::/32", "+--++-"},
           {"hosts allow = 192.168.0.0/16 EXCEPT 192.168.7.0/255.255.255.0", "+--+--"},
           {"hosts deny = all except 192.168.7.9", "--+---"},
           {"hosts deny = ALL EXCEPT 127. EXCEPT 127.0.0.1", "++----"},
           {"hosts deny = EXCEPT 127.", "+++++-"},
           {"hosts deny = 127.0.0.2/31", "+-+++-"},
           {"hosts deny = 1.2.3.4/0", "---++-"},
           {"hosts deny = ::ffff:127.0.0.2", "+-+++-"},
           {"hosts deny = 0:0::1", "+++++-"}}) {
    EXPECT_EQ(EnteredFrom(rules), from) << rules;
  }
}

TEST(HostRules, OfTheServerBindEveryShare) {
  const ShareTable table = ShareTable::Parse(
      "[global]\nhosts deny = 127.0.0.2\n[a]\npath=/a\nhosts allow = ALL\n[b]\npath=/b\n"
      "hosts deny = 10.\n");
  for (const ShareSettings& share : table.Shares()) {
    EXPECT_FALSE(share.IsOpenTo(ClientAddress("127.0.0.2"))) << share.name;
    EXPECT_TRUE(share.IsOpenTo(ClientAddress("127.0.0.3"))) << share.name;
  }
  EXPECT_EQ(table.Shares().size(), 2u);
}

TEST(HostRules, WithNamesWithholdTheShare) {
  for (const std::string entry : {"box",
                                  ".example.org",
                                  "@group",
                                  "LOCAL",
                                  "FAIL",
                                  "127.0.0.*",
                                  "127.0.0",
                                  "127.0.0.1/33",
                                  "127.0.0.1/08",
                                  "127.0.0.1/032",
                                  "127.0.0/24",
                                  "[::1]/64",
                                  "::1/128",
                                  "::1/129",
                                  "fe80:",
                                  "10.0.0.0/",
                                  "10.0.0.0/ffff::",
                                  "%m",
                                  "::ffff:0:0/96",
                                  "::ffff:10.0.0.0/24",
                                  "/",
                                  "."}) {
    EXPECT_EQ(EnteredFrom("hosts allow = 127. " + entry), "") << entry;
    EXPECT_EQ(EnteredFrom("hosts deny = 127. EXCEPT " + entry), "") << entry;
    const ShareTable table = ShareTable::Parse("[a]\npath = /a\nhosts deny = " + entry + "\n");
    ASSERT_EQ(table.Withheld().size(), 1u) << entry;
    EXPECT_THAT(table.Withheld()[0].reason, HasSubstr(entry + ", which no address tells"));
  }
  const std::string lookups = "[global]\nhostname lookups = yes\n[a]\npath = /a\n";
  EXPECT_TRUE(ShareTable::Parse(lookups).Find("a"));
  EXPECT_FALSE(ShareTable::Parse(lookups + "hosts deny = 10.\n").Find("a"));
}

/// Random lists of entries that are judged.
class Lists {
 public:
  std::string Rules() {
    std::string rules;
    if (Pick(3)) rules += "hosts allow =" + List() + "\n";
    if (Pick(3)) rules += "hosts deny =" + List() + "\n";
    return rules;
  }
  unsigned Pick(unsigned below) { return static_cast<unsigned>(random_() % below); }

 private:
  std::string List() {
    static const std::string entries[] = {"ALL",
                                          "EXCEPT",
                                          "except",
                                          "localhost",
                                          "127.",
                                          "127.0.0.1",
                                          "127.0.0.2",
                                          "10.",
                                          "10.1.",
                                          "10.1.2.3",
                                          "10.1.2.0/24",
                                          "10.1.2.3/31",
                                          "10.0.0.0/8",
                                          "10.1.2.3/1",
                                          "0.0.0.0/0",
                                          "10.1.2.3/32",
                                          "::1",
                                          "2001:db8::/32",
                                          "2001:db8:0:1::/64",
                                          "2001:db8::/40",
                                          "2001:db8::5",
                                          "::/0",
                                          "::ffff:10.1.2.3",
                                          "10.0.2.3/255.0.255.0",
                                          "2001:db8::/ffff:ffff::",
                                          "10.1.2.0/255.255.255.0",
                                          "::ffff:127.0.0.2"};
    std::string list;
    for (unsigned count = 1 + Pick(4); count > 0; --count) {
      list += " " + entries[Pick(std::size(entries))];
    }
    return list;
  }

  std::mt19937 random_{7};
};

/// What Samba's own testparm says of each share ("s0", …) for the address.
std::string SambaSays(const std::string& file, const std::string& address, std::size_t shares) {
  const std::string command = "testparm -s " + file + " " + address + " " + address + " 2>&1";
  std::string says(shares, '?');
  FILE* stream = popen(command.c_str(), "r");
  char line[512];
  while (stream && fgets(line, sizeof line, stream)) {
    const std::string text = line;
    const std::size_t to = text.rfind(" to s");
    const bool allowed = text.starts_with("Allow connection from ");
    if (to == text.npos || (!allowed && !text.starts_with("Deny connection from "))) continue;
    const std::size_t number = std::stoul(text.substr(to + 5));
    if (number < shares) says[number] = allowed ? '+' : '-';
  }
  if (stream) pclose(stream);
  return says;
}

TEST(HostRules, AgreeWithSamba) {
  if (system("command -v testparm >/dev/null") != 0) GTEST_SKIP() << "needs testparm";
  constexpr std::size_t kShares = 400;
  Lists lists;
  std::string settings;
  std::vector<std::string> rules(kShares);
  for (std::size_t i = 0; i < kShares; ++i) {
    rules[i] = lists.Rules();
    settings += "[s" + std::to_string(i) + "]\npath = /\n" + rules[i];
  }
  const TempFolder folder;
  std::ofstream(folder / "smb.conf") << settings;
  const ShareTable table = ShareTable::Parse(settings);
  ASSERT_EQ(table.Shares().size(), kShares) << table.Withheld()[0].reason;
  for (const std::string address :
       {"127.0.0.1", "127.0.0.2", "10.1.2.3", "10.1.2.2", "10.1.3.3", "10.9.2.3", "192.0.2.1",
        "::1", "2001:db8::5", "2001:db8:0:1::5", "2001:db8:8000::1", "fe80::1"}) {
    const std::string says = SambaSays(folder / "smb.conf", address, kShares);
    for (std::size_t i = 0; i < kShares; ++i) {
      const bool open = table.Find("s" + std::to_string(i))->IsOpenTo(ClientAddress(address));
      EXPECT_EQ(says[i], open ? '+' : '-') << address << "\n" << rules[i];
    }
  }
}

}  // namespace
