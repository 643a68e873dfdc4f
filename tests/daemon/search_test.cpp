#include <grp.h>
#include <sys/wait.h>

#include <random>
#include <set>

#include "daemon/core/page_check.h"
#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

class SearchTest : public DaemonTest {};

TEST_F(SearchTest, AnswersTotalThenHitsThenSuccess) {
  File("photo/trip/Lisbon.JPG", "harbour at night", 0644, bin_.uid);
  File("photo/notes.txt", "harbour");
  Index();
  const auto messages = Ask(bin_, "search", Parsed(R"({
    "pre_query": {"keyword": "lisbon", "criteria_list": [], "file_type": "image",
                  "search_weight_list": [{"field": "MARUMDFSName", "weight": 2}]},
    "indice": ["fileindex_photo"], "from": 0, "size": 10, "default_search_op": "AND",
    "load_field": ["MARUMDPath", "MARUMDFSName", "MARUMDExtension", "MARUMDIsDir", "MARUMDFSSize"],
    "fields": ["MARUMDKind", "MARUMDModTime", "MARUMDAuthors", "MARUMDTextContent"],
    "lazy_field": ["MARUMDTextContent"],
    "filters": [{"name": "permission", "data": "bin"}],
    "highlight": [{"field": "MARUMDFSName", "frag_length": 50, "num_fragments": 1},
                  {"field": "MARUMDTextContent"}],
    "collector": {"agent": "others", "uid": 2, "has_criteria": false}})"));
  ASSERT_EQ(messages.size(), 3u) << json::ToString(messages.back());
  EXPECT_EQ(json::ToString(messages[0]), R"({"total":1})");
  EXPECT_EQ(json::ToString(messages[2]), R"({"success":true})");
  Json::Value hit = messages[1];
  EXPECT_GT(hit["score"].asInt64(), 0);
  hit.removeMember("score");
  EXPECT_TRUE(hit["doc_id"].isUInt());
  hit.removeMember("doc_id");
  EXPECT_TRUE(hit["MARUMDModTime"].isInt64());
  hit.removeMember("MARUMDModTime");
  EXPECT_EQ(json::ToString(hit),
            R"({"MARUMDAuthors":[],"MARUMDExtension":"jpg","MARUMDFSName":"Lisbon.JPG",)"
            R"("MARUMDFSSize":16,"MARUMDIsDir":false,"MARUMDKind":"image",)"
            R"("MARUMDOwnerUserID":"2","MARUMDPath":"/volume1/photo/trip/Lisbon.JPG",)"
            R"("highlight":{"MARUMDFSName":["<mark>Lisbon</mark>.JPG"]},"id":"fileindex_photo"})");
  const auto folder = Ask(
      bin_, "search", Parsed(R"({"pre_query": {"keyword": "trip"}, "fields": ["MARUMDKind"]})"));
  ASSERT_EQ(folder.size(), 3u);
  EXPECT_EQ(folder[1]["MARUMDKind"], "folder");
}

TEST_F(SearchTest, NarrowsByTypeCriteriaAndPlace) {
  File("photo/trip/a.txt", "harbour boats");
  File("photo/trip/deep/b.md", std::string(5000, 'x') + " harbour");
  File("photo/c.mp3", "harbour");
  AddShare("docs");
  AddShare("unindexed");
  File("docs/d.txt", "harbour");
  Index();
  Index("docs");
  const auto with = [&](const std::string& pre_query, const std::string& more = "") {
    Json::Value data = Parsed("{\"pre_query\": {" + pre_query + "}" + more + "}");
    data["load_field"].append("MARUMDFSName");
    Strings names;
    for (const Json::Value& message : Ask(root_user_, "search", data)) {
      if (message.isMember("MARUMDFSName")) names.push_back(message["MARUMDFSName"].asString());
    }
    std::sort(names.begin(), names.end());
    return names;
  };
  const std::string harbour = R"("keyword": "harbour")";
  EXPECT_EQ(with(harbour), (Strings{"a.txt", "b.md", "c.mp3", "d.txt"}));
  EXPECT_EQ(with(harbour + R"(, "file_type": "audio")"), (Strings{"c.mp3"}));
  EXPECT_EQ(with(harbour, R"(, "filters": [{"name": "file_type", "data": "audio"}])"),
            (Strings{"c.mp3"}));
  EXPECT_EQ(with(harbour, R"(, "indice": ["fileindex_docs", "fileindex_docs", "fileindex_none",
            "fileindex_unindexed", "other"])"),
            (Strings{"d.txt"}));
  EXPECT_EQ(with(harbour, R"(, "indice": [])"), (Strings{}));
  EXPECT_EQ(with(R"("keyword": "boats -lake")"), (Strings{"a.txt"}));
  EXPECT_EQ(with(R"("keyword": "boats mp3")", R"(, "default_search_op": "OR")"),
            (Strings{"a.txt", "c.mp3"}));
  const auto criterion = [](const char* field, const char* value) {
    return std::string(R"("criteria_list": [{"field": ")") + field + R"(", "value": ")" + value +
           R"("}])";
  };
  EXPECT_EQ(with(criterion("MARUMDPath", "/photo/trip") + R"(, "keyword": "harbour")"),
            (Strings{"a.txt", "b.md"}));
  EXPECT_EQ(with(criterion("MARUMDFSSize", ">4k") + R"(, "keyword": "harbour")"),
            (Strings{"b.md"}));
  EXPECT_EQ(with(criterion("MARUMDExtension", ".md OR mp3")), (Strings{"b.md", "c.mp3"}));
  EXPECT_EQ(with(criterion("MARUMDIsDir", "true")), (Strings{"deep", "docs", "photo", "trip"}));
  EXPECT_EQ(with(criterion("MARUMDTextContent", "boats")), (Strings{"a.txt"}));
  EXPECT_EQ(with(R"("keyword": "  ")"), (Strings{}));
  EXPECT_EQ(with(R"("keyword": " ", "file_type": "audio,document")"),
            (Strings{"a.txt", "b.md", "c.mp3", "d.txt"}));
}

TEST_F(SearchTest, PagesSortAndStayExact) {
  for (int i = 0; i < 25; ++i)
    File("photo/n" + std::to_string(i), std::string(i + 10, 'a') + " word");
  Index();
  std::vector<Json::UInt64> sizes;
  for (int from = 0; from < 30; from += 10) {
    Json::Value data = Parsed(R"({"pre_query": {"keyword": "word"}, "size": 10,
      "sort": {"field": "MARUMDFSSize", "direction": "ASC"}, "fields": ["MARUMDFSSize"]})");
    data["from"] = from;
    const auto messages = Ask(bin_, "search", data);
    EXPECT_EQ(messages[0]["total"].asInt(), 25);
    for (std::size_t i = 1; i + 1 < messages.size(); ++i) {
      sizes.push_back(messages[i]["MARUMDFSSize"].asUInt64());
    }
  }
  EXPECT_EQ(sizes.size(), 25u);
  EXPECT_TRUE(std::is_sorted(sizes.begin(), sizes.end()));
  EXPECT_EQ(std::set(sizes.begin(), sizes.end()).size(), 25u);
  const auto largest = Ask(bin_, "search", Parsed(R"({"pre_query": {"keyword": "word"}, "size": 1,
      "sort": {"field": "MARUMDFSSize"}, "fields": ["MARUMDFSSize"],
      "highlight": {"frag_length": 1000000000000, "num_fragments": 1000000000000}})"));
  ASSERT_EQ(largest.size(), 3u) << json::ToString(largest.back());
  EXPECT_EQ(largest[1]["MARUMDFSSize"].asUInt64(), sizes.back());
  EXPECT_EQ(largest[1]["highlight"]["MARUMDTextContent"].size(), 1u) << "one is a list, too";
}

TEST_F(SearchTest, ThePageIsCheckedAgainstTheFilesOnceMore) {
  for (int i = 0; i < 30; ++i) File("photo/many/f" + std::to_string(i), "word");
  File("photo/away/a", "word");
  File("photo/shut/b", "word");
  File("photo/swapped/c", "word");
  Index();
  EXPECT_EQ(Names(bin_, "word").size(), 33u);
  // Gone, made unreadable, closed above, and a folder replaced by a link to a readable one: the
  // index knows nothing of it yet.
  std::filesystem::remove_all(root_ + "/photo/away");
  chmod((root_ + "/photo/shut").c_str(), 0700);
  std::filesystem::rename(root_ + "/photo/swapped", root_ + "/elsewhere");
  std::filesystem::create_directory_symlink(root_ + "/elsewhere", root_ + "/photo/swapped");
  chmod((root_ + "/photo/many/f0").c_str(), 0600);
  const Strings names = Names(bin_, "word");
  EXPECT_EQ(names.size(), 29u);
  EXPECT_EQ(std::count(names.begin(), names.end(), "f0"), 0);
  EXPECT_EQ(Names(root_user_, "word").size(), 31u) << "for root only what is gone falls out";
  // A page is filled up with what follows.
  const auto messages =
      Ask(bin_, "search", Parsed(R"({"pre_query": {"keyword": "word"}, "size": 20})"));
  EXPECT_EQ(messages.size(), 22u);
  EXPECT_LE(messages[0]["total"].asInt(), 33);
  EXPECT_GE(messages[0]["total"].asInt(), 29);
  // The share's own folder counts, too: to be read itself, and to be passed.
  EXPECT_EQ(Names(bin_, "photo"), (Strings{"photo"}));
  chmod((root_ + "/photo").c_str(), 0711);
  EXPECT_EQ(Names(bin_, "photo"), (Strings{}));
  EXPECT_EQ(Names(bin_, "word").size(), 29u);
  chmod((root_ + "/photo").c_str(), 0700);
  EXPECT_EQ(Names(bin_, "word"), (Strings{}));
}

TEST_F(SearchTest, NoPathIsFollowedWithoutEnd) {
  std::string path = "/photo";
  for (std::size_t depth = 1; depth < kMaxPathDepth; ++depth) path += "/d";
  File(path + "/d/f", "word");
  const Scope scope{{bin_, "bin"}, {{"fileindex_photo", table_->Find("photo"), bin_}}, table_};
  const index::Hit last = HitAt("photo", path.substr(std::string("/photo").size()) + "/d");
  const index::Hit deeper = HitAt("photo", last.path + "/f");
  EXPECT_EQ(ReadableNow(scope, {last, deeper}), (std::vector<bool>{true, false}));
}

/// What took the place of a file that was indexed is not that file.
TEST_F(SearchTest, AnotherFileInItsPlaceIsNoHit) {
  const std::string path = root_ + "/photo/a.txt", other = root_ + "/photo/b.txt";
  File("photo/a.txt", "word");
  File("photo/b.txt", "else");
  Index();
  ASSERT_EQ(Names(bin_, "word"), (Strings{"a.txt"}));
  const std::function<void()> takes[] = {
      [&] { std::filesystem::create_symlink("b.txt", path); }, [&] { mkfifo(path.c_str(), 0644); },
      [&] { mkdir(path.c_str(), 0755); }, [&] { std::filesystem::rename(other, path); }};
  for (const auto& take : takes) {
    std::filesystem::rename(path, root_ + "/aside");
    take();
    EXPECT_EQ(Names(bin_, "word"), (Strings{}));
    std::filesystem::remove(path);
    std::filesystem::rename(root_ + "/aside", path);
    EXPECT_EQ(Names(bin_, "word"), (Strings{"a.txt"}));
  }
}

TEST_F(SearchTest, NobodySeesMoreThanTheirOwn) {
  File("photo/all.txt", "word");
  File("photo/bins.txt", "word", 0600, bin_.uid);
  File("photo/games.txt", "word", 0600, games_.uid);
  AddShare("club", "valid users = games");
  File("club/member.txt", "word");
  AddShare("homes", "invalid users = games");
  File("homes/bin/diary.txt", "word", 0600, bin_.uid);
  for (const char* share : {"photo", "club", "homes"}) Index(share);
  const auto named = [](const char* user) {
    return std::string(R"({"filters": [{"name": "permission", "data": ")") + user + R"("}]})";
  };
  const Strings bins{"all.txt", "bins.txt", "diary.txt"};
  const Strings games{"all.txt", "games.txt", "member.txt"};
  EXPECT_EQ(Names(bin_, "word"), bins);
  EXPECT_EQ(Names(games_, "word"), games);
  EXPECT_EQ(Names(bin_, "word", named("bin")), bins);
  EXPECT_EQ(Names(bin_, "word", named("games")), (Strings{})) << "another's name never widens";
  EXPECT_EQ(Names(bin_, "word", named("root")), (Strings{}));
  EXPECT_EQ(Names(root_user_, "word").size(), 5u);
  EXPECT_EQ(Names(root_user_, "word", named("bin")), bins);
  EXPECT_EQ(Names(root_user_, "word", named("games")), games);
  EXPECT_EQ(Names(root_user_, "word", named("no such user")), (Strings{}));
  EXPECT_EQ(Names(root_user_, "word", named("bin\\u0000")), (Strings{}));
  EXPECT_EQ(Names(root_user_, "word", R"({"filters": [{"name": "permission", "data": "bin"},
                                       {"name": "permission", "data": "games"}]})"),
            (Strings{}));
  EXPECT_EQ(Names(bin_, "word", R"({"indice": ["fileindex_club"]})"), (Strings{}));
  EXPECT_EQ(Names({4'000'000'001, {}, false}, "word"), (Strings{})) << "no account";
  // A share that is no more has nobody's to show.
  table_ = std::make_shared<const ShareTable>(
      ShareTable::Parse("[global]\n[photo]\n\tpath = " + root_ + "/photo\n"));
  EXPECT_EQ(Names(root_user_, "word"), (Strings{"all.txt", "bins.txt", "games.txt"}));
}

TEST_F(SearchTest, ShareRulesPutOthersInTheUsersPlace) {
  const auto others = IdentityOfUser("daemon").value();
  AddShare("forced", "force user = games");
  AddShare("root", "admin users = bin");
  AddShare("veto", "veto files = /*.bak/");
  std::filesystem::create_directories(root_ + "/closed/below");
  std::filesystem::create_directory_symlink("closed/below", root_ + "/below");
  AddShare("below");
  File("forced/g", "word", 0600, games_.uid);
  File("forced/b", "word", 0600, bin_.uid);
  File("root/r", "word", 0600);
  File("veto/v.bak", "word");
  File("below/c", "word");
  ASSERT_EQ(chmod((root_ + "/closed").c_str(), 0700), 0);
  ASSERT_EQ(chown((root_ + "/closed").c_str(), games_.uid, 0), 0);
  for (const char* share : {"forced", "root", "veto", "below"}) Index(share);
  EXPECT_EQ(Names(bin_, "word"), (Strings{"g", "r"}));
  EXPECT_EQ(Names(games_, "word"), (Strings{"c", "g"}));
  EXPECT_EQ(Names(others, "word"), (Strings{"g"}));
  // An index that knows nothing of the veto patterns is none.
  EXPECT_EQ(Names(root_user_, "word", R"({"indice": ["fileindex_veto"]})"), (Strings{}));
  RecordCrawlTerms(root_ + "/index/fileindex_veto", CrawlTermsOf(*table_->Find("veto")));
  EXPECT_EQ(Names(root_user_, "word", R"({"indice": ["fileindex_veto"]})"), (Strings{"v.bak"}));
  EXPECT_EQ(Names(bin_, "word", R"({"indice": ["fileindex_veto"]})"), (Strings{}))
      << "the page check judges patterns too";
}

/// What the child process of that user can open.
Strings Openable(const Identity& who, const std::string& folder) {
  int ends[2];
  EXPECT_EQ(pipe(ends), 0);
  const pid_t child = fork();
  if (child == 0) {
    const gid_t group = who.groups[0];
    if (setgroups(0, nullptr) != 0 || setresgid(group, group, group) != 0 ||
        setresuid(who.uid, who.uid, who.uid) != 0) {
      _exit(1);
    }
    for (int i = 0; i < 600; ++i) {
      char name[32];
      snprintf(name, sizeof name, "/f%d", i);
      for (const char* middle : {"", "/a", "/b", "/a/c", "/a/d", "/b/e", "/b/e/g"}) {
        const int file = open((folder + middle + name).c_str(), O_RDONLY);
        if (file < 0) continue;
        close(file);
        dprintf(ends[1], "f%d\n", i);
      }
    }
    _exit(0);
  }
  close(ends[1]);
  Strings names;
  FILE* stream = fdopen(ends[0], "r");
  for (char line[32]; fgets(line, sizeof line, stream);) {
    names.emplace_back(line, strcspn(line, "\n"));
  }
  fclose(stream);
  int status = 0;
  waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  std::sort(names.begin(), names.end());
  return names;
}

TEST_F(SearchTest, AShareIsThereForTheAddressesItIsOpenTo) {
  AddShare("near", "hosts deny = 192.0.2.");
  AddShare("far", "hosts deny = ALL\n\thosts allow = 192.0.2.0/24");
  File("near/near.txt", "word");
  File("far/far.txt", "word");
  Index("near");
  Index("far");
  const Identity root{0, {}, true};
  for (const Identity& who : {bin_, root}) {
    client_ = ClientAddress::OfThisMachine();
    EXPECT_EQ(Names(who, "word"), Strings{"near.txt"});
    client_ = ClientAddress("192.0.2.7");
    EXPECT_EQ(Names(who, "word"), Strings{"far.txt"});
    client_ = ClientAddress();
    EXPECT_EQ(Names(who, "word"), Strings{});
  }
}

TEST_F(SearchTest, SeesWhatTheKernelLetsThatUserOpen) {
  std::mt19937 random(7);
  const unsigned modes[] = {0755, 0711, 0700, 0750, 0644, 0640, 0600, 0044, 0604, 0000};
  const uid_t users[] = {0, bin_.uid, games_.uid};
  const gid_t groups[] = {0, bin_.groups[0], games_.groups[0]};
  const char* folders[] = {"", "/a", "/b", "/a/c", "/a/d", "/b/e", "/b/e/g"};
  const auto any_rights = [&](const std::string& path) {
    ASSERT_EQ(chmod(path.c_str(), modes[random() % std::size(modes)]), 0);
    ASSERT_EQ(chown(path.c_str(), users[random() % 3], groups[random() % 3]), 0);
    if (random() % 3) return;
    const std::string entry = std::string(random() % 2 ? "user:bin:" : "group:games:") +
                              (random() % 2 ? "r-x" : "---") +
                              ",mask::" + (random() % 3 ? "r-x" : "--x");
    const std::string command = "setfacl -m " + entry + " '" + path + "'";
    ASSERT_EQ(system(command.c_str()), 0);
  };
  for (int round = 0; round < 4; ++round) {
    AddShare("s" + std::to_string(round));
    const std::string share = root_ + "/s" + std::to_string(round);
    for (int i = 0; i < 150; ++i) {
      const std::string path = folders[random() % std::size(folders)] + ("/f" + std::to_string(i));
      File("s" + std::to_string(round) + path, "word");
      any_rights(share + path);
    }
    for (const char* folder : folders) {
      if (random() % 2 && *folder) any_rights(share + folder);
    }
    Index("s" + std::to_string(round));
    // Rights that changed after indexing narrow at once.
    if (round % 2) any_rights(share + "/b");
    const std::string where = "{\"indice\": [\"fileindex_s" + std::to_string(round) + "\"]}";
    for (const Identity* who : {&bin_, &games_}) {
      const Strings found = Names(*who, "word", where);
      const Strings openable = Openable(*who, share);
      if (round % 2) {
        EXPECT_TRUE(std::includes(openable.begin(), openable.end(), found.begin(), found.end()));
      } else {
        EXPECT_EQ(found, openable);
      }
    }
  }
}

TEST_F(SearchTest, RefusesWhatIsMalformed) {
  Index();
  for (const char* bad : {
           R"({"indice": ["../photo"]})",
           R"({"indice": ["fileindex_a/b"]})",
           R"({"indice": [""]})",
           R"({"indice": ["a\u0000b"]})",
           R"({"indice": ["a\u007fb"]})",
           R"({"indice": [".."]})",
           R"({"indice": "fileindex_photo"})",
           R"({"indice": [5]})",
           R"({"from": -1})",
           R"({"size": 10001})",
           R"({"size": "5"})",
           R"({"default_search_op": "XOR"})",
           R"({"load_field": ["Name"]})",
           R"({"lazy_field": ["Name"]})",
           R"({"fields": [1]})",
           R"({"filters": [{"name": "owner", "data": "x"}]})",
           R"({"filters": [{"name": "permission"}]})",
           R"({"filters": [{"name": "permission", "data": 7}]})",
           R"({"sort": {"field": "MARUMDFSName"}})",
           R"({"sort": {"field": "MARUMDFSSize",
             "direction": "up"}})",
           R"({"pre_query": []})",
           R"({"colour": "red"})",
           R"({"highlight": [{"field": "MARUMDFSSize"}]})",
           R"({"highlight": [7]})",
           R"({"size": 10000, "highlight": [{"frag_length": 1000, "num_fragments": 20}]})",
       }) {
    EXPECT_EQ(Code(bin_, "search", Parsed(bad)), 120) << bad;
  }
  Json::Value long_list, long_text, long_item;
  for (int i = 0; i < 65; ++i) long_list["fields"].append("MARUMDPath");
  long_text["collector"]["agent"] = std::string(257, 'x');
  long_item["indice"].append(std::string(301, 'x'));
  for (const Json::Value& bad : {long_list, long_text, long_item}) {
    EXPECT_EQ(Code(bin_, "search", bad), 120) << json::ToString(bad);
  }
  std::string name = "x";
  for (int i = 0; i < 31; ++i) name += "é";
  EXPECT_EQ(Ask(bin_, name).back()["error"]["msg"],
            "Unknown command \"" + name.substr(0, 59) + "…\"");
  for (const char* bad :
       {"", "abc", "[]", "{}", "{\"command\": 1}", "{\"command\": \"drop\"}",
        "{\"command\": \"search\", \"data\": []}", "{\"command\": \"search\", \"more\": 1}",
        "{\"command\": \"search\"} x", "{\"command\": \"search\", "}) {
    const auto messages = Say(bin_, bad);
    ASSERT_EQ(messages.size(), 1u) << bad;
    EXPECT_FALSE(messages[0]["success"].asBool()) << bad;
    EXPECT_EQ(messages[0]["error"]["code"].asInt(), 120) << bad;
    EXPECT_FALSE(messages[0]["error"]["msg"].asString().empty()) << bad;
  }
}

TEST_F(SearchTest, ExplainTellsTheQueryAndStatusItsDetailsToOperatorsOnly) {
  Index();
  const Json::Value plain = Data(bin_, "status", {});
  EXPECT_EQ(plain.size(), 2u);
  const Json::Value full = Data(root_user_, "status", {});
  EXPECT_EQ(full["indices"][0]["id"], "fileindex_photo");
  EXPECT_EQ(full["indices"][0]["documents"].asInt(), 1);
  const Json::Value explained = Data(
      bin_, "explain",
      Parsed(R"({"pre_query": {"criteria_list": [{"field": "MARUMDTitle", "value": "a*"}]}})"));
  EXPECT_EQ(explained["query"], "a*@MARUMDTitle:1");
  EXPECT_EQ(explained["indice"], Parsed(R"(["fileindex_photo"])"));
}

}  // namespace
}  // namespace maru::daemon::test
