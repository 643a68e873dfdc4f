#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>

#include "common/common.h"
#include "common/db/search_history.h"
#include "common/sdk/credentials.h"
#include "plugin/plugin.h"
#include "support/fake_daemon.h"
#include "system/preferences.h"
#include "system/unique_fd.h"
#include "system/whole_file.h"

namespace {

using marudbquery::Condition;
using maruseeker::db::SearchHistory;
using maruseeker::db::SearchHistoryTable;
using maruseeker::db::SelectParam;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

constexpr const char* kDatabase = "/var/lib/maruseeker/history.db";
constexpr const char* kJournal = "/var/lib/maruseeker/history.journal";

class History : public PluginTest {
 protected:
  void SetUp() override {
    PluginTest::SetUp();
    if (IsSkipped()) return;
    for (const char* end : {"", "-wal", "-shm"}) unlink((std::string(kDatabase) + end).c_str());
    std::filesystem::remove_all(kJournal);
    std::filesystem::remove_all(std::string(kJournal) + ".taken");
  }

  static SearchHistory Query(unsigned uid, const std::string& keyword, long time) {
    SearchHistory query;
    query.uid = uid;
    query.keyword = keyword;
    query.create_time = time;
    return query;
  }

  /// Works as the service in a child process.
  static Ran AsService(const std::function<Json::Value(SearchHistoryTable&)>& work) {
    return InChild([&] {
      const maruseeker::sdk::SDKCredentials service("MaruSeeker");
      SearchHistoryTable table;
      return work(table);
    });
  }

  /// Records the keywords in order, a second apart, and tells whether all went well.
  static bool Record(unsigned uid, const std::vector<std::string>& keywords, int max = 0,
                     long time = 1000) {
    return AsService([&](SearchHistoryTable& table) {
             bool good = true;
             long now = time;
             for (const std::string& keyword : keywords) {
               SearchHistory query = Query(uid, keyword, now++);
               good = table.UpdateWithTime(query, max) && good;
             }
             return Json::Value(good);
           })
        .value.asBool();
  }

  /// "total: keyword@time ..." as `get` answers it.
  static std::string Get(const Login& login, const std::string& params = "{}") {
    const Answer answer = Ask(login, "get", FromText(params));
    if (!answer.success) return std::to_string(answer.code);
    std::string text = answer.data["total"].asString() + ":";
    for (const Json::Value& row : answer.data["historys"]) {
      EXPECT_EQ(row.size(), 3u);
      text += " " + row["keyword"].asString() + "@" + row["create_time"].asString();
    }
    return text;
  }

  static std::string IDs(const Login& login) {
    std::string ids;
    const Answer answer = Ask(login, "get", FromText("{'limit':0,'sort_by':'id'}"));
    for (const Json::Value& row : answer.data["historys"]) {
      ids += (ids.empty() ? "" : ",") + row["id"].asString();
    }
    return ids;
  }

  static Answer Delete(const Login& login, const std::string& ids) {
    return Ask(login, "delete", FromText("{'id':[" + ids + "]}"));
  }
};

TEST_F(History, PagesSortedAndFiltered) {
  EXPECT_EQ(Get(Alice()), "0:");
  ASSERT_TRUE(Record(60001, {"pear", "apple", "fig", "grape"}));
  ASSERT_TRUE(Record(60002, {"bob's", "fig"}, 0, 2000));
  EXPECT_EQ(Get(Alice()), "4: pear@1000 apple@1001 fig@1002 grape@1003");
  EXPECT_EQ(Get(Bob()), "2: bob's@2000 fig@2001");
  EXPECT_EQ(Get(Alice(), "{'limit':2,'offset':1}"), "4: apple@1001 fig@1002");
  EXPECT_EQ(Get(Alice(), "{'limit':-2,'offset':-1}"),
            "4: pear@1000 apple@1001 fig@1002 grape@1003");
  EXPECT_EQ(Get(Alice(), "{'offset':3,'limit':0}"), "4: grape@1003");
  EXPECT_EQ(Get(Alice(), "{'sort_by':'keyword','sort_direction':'aSc','limit':2}"),
            "4: apple@1001 fig@1002");
  for (const char* down : {"desc", "", "up"}) {
    EXPECT_EQ(Get(Alice(), "{'sort_by':'create_time','sort_direction':'" + std::string(down) +
                               "','limit':1}"),
              "4: grape@1003");
  }
  EXPECT_EQ(Get(Alice(), "{'sort_direction':'desc','limit':1}"), "4: pear@1000");
  EXPECT_EQ(Get(Alice(), "{'substr':'ap','limit':1}"), "2: apple@1001");
  EXPECT_EQ(Get(Alice(), "{'substr':''}"), Get(Alice()));
  for (const char* column : {"nope", "id; DROP TABLE search_history", "id'", "rowid"}) {
    Json::Value params;
    params["sort_by"] = column;
    const Answer answer = Ask(Alice(), "get", params);
    EXPECT_EQ(answer.code, 9999) << column;
    EXPECT_THAT(answer.log, HasSubstr("(Execute) Failed [!table.GetAll(recs, cond, "
                                      "db::SelectParam(offset_, limit_, sort_by_, asc_))], "
                                      "reason: "));
    EXPECT_THAT(answer.log, Not(HasSubstr("[err: "))) << "no file failed";
  }
}

TEST_F(History, DeletesOwnRowsOnly) {
  ASSERT_TRUE(Record(60001, {"one", "two", "three"}));
  ASSERT_TRUE(Record(60002, {"four"}));
  EXPECT_EQ(IDs(Alice()) + " " + IDs(Bob()), "1,2,3 4");
  const Answer good = Delete(Alice(), "1,4,99,-1");
  EXPECT_TRUE(good.success);
  EXPECT_TRUE(good.data.isNull());
  EXPECT_EQ(IDs(Alice()) + " " + IDs(Bob()), "2,3 4");
  // Ids that no row can have select nothing, and above all not everything.
  EXPECT_TRUE(Delete(Alice(), "3000000000").success);
  EXPECT_TRUE(Delete(Alice(), "-9223372036854775808,18446744073709551615").success);
  EXPECT_EQ(IDs(Alice()), "2,3");
  EXPECT_TRUE(Delete(Alice(), "2.0,2").success);
  EXPECT_EQ(IDs(Alice()), "3");
  const Answer none = Delete(Alice(), "");
  EXPECT_EQ(none.code, 9999);
  EXPECT_THAT(none.log, HasSubstr("(Execute) Failed [0 == id_.size()], reason: "));
  const Ran unchecked = InChild([] { return Enter(Alice(), "delete", FromText("{'id':3}")); });
  EXPECT_EQ(unchecked.value["code"], 120);
  EXPECT_THAT(unchecked.log, HasSubstr("(ParseParams) Failed [id.IsInvalid()], reason: "));
}

TEST_F(History, KeywordsOfAnyKind) {
  const std::vector<std::string> keywords = {
      "100%", "under_score", "it's \"quoted\"", "back\\slash", "😀 smile", "", "日本語", "a;b--"};
  ASSERT_TRUE(Record(60001, keywords));
  ASSERT_TRUE(Record(60001, keywords, 0, 2000));
  EXPECT_EQ(IDs(Alice()), "1,2,3,4,5,6,7,8");
  for (const std::string& keyword : keywords) {
    if (keyword.empty()) continue;
    Json::Value params;
    params["substr"] = keyword;
    const Answer answer = Ask(Alice(), "get", params);
    EXPECT_EQ(answer.data["total"], 1) << keyword;
    EXPECT_EQ(answer.data["historys"][0]["keyword"], keyword);
  }
  EXPECT_EQ(Get(Alice(), "{'substr':'%%'}"), "0:");
  EXPECT_EQ(Get(Alice(), "{'substr':'SMILE'}"), "0:");
}

TEST_F(History, NewestStayAndNoneIsDoubled) {
  const auto by_id = [] { return Get(Alice(), "{'sort_by':'id'}"); };
  ASSERT_TRUE(Record(60001, {"a", "b", "c", "a"}, 10));
  EXPECT_EQ(by_id(), "3: a@1003 b@1001 c@1002");
  ASSERT_TRUE(Record(60002, {"theirs"}));
  ASSERT_TRUE(Record(60001, {"d"}, 3, 2000));
  EXPECT_EQ(by_id(), "3: a@1003 c@1002 d@2000");
  EXPECT_EQ(Get(Bob()), "1: theirs@1000");
  // What was just recorded stays even when the clock went back, and with room for one only.
  ASSERT_TRUE(Record(60001, {"early"}, 2, 5));
  EXPECT_EQ(by_id(), "2: d@2000 early@5");
  ASSERT_TRUE(Record(60001, {"x", "y"}, 1, 7));
  EXPECT_EQ(by_id(), "1: y@8");
  ASSERT_TRUE(Record(60001, {"same"}, 2, 8));
  ASSERT_TRUE(Record(60001, {"second"}, 2, 8));
  EXPECT_EQ(by_id(), "2: same@8 second@8");
  ASSERT_TRUE(Record(60001, {"n"}, -3, 9));
  EXPECT_EQ(by_id(), "3: same@8 second@8 n@9");
}

TEST_F(History, TenThousandRows) {
  std::vector<std::string> keywords;
  for (int i = 0; i < 10'000; ++i) keywords.push_back("k" + std::to_string(i));
  const Ran filled = AsService([&](SearchHistoryTable&) {
    auto* session = maruseeker::db::DBSession::Instance();
    std::string error;
    return Json::Value(session->Transaction(
        [&] {
          marudbquery::InsertStatement insert(session, "search_history");
          for (std::size_t i = 0; i < keywords.size(); ++i) {
            if (!insert.Execute(Query(60001, keywords[i], static_cast<long>(i)))) return false;
          }
          return true;
        },
        error));
  });
  ASSERT_TRUE(filled.value.asBool());
  const Answer all = Ask(Alice(), "get", FromText("{'limit':0}"));
  EXPECT_EQ(all.data["historys"].size(), 10'000u);
  EXPECT_EQ(Ask(Alice(), "get", FromText("{}")).data["historys"].size(), 50u);
  std::string ids = "1";
  for (int i = 2; i <= 5'000; ++i) ids += "," + std::to_string(i);
  EXPECT_TRUE(Delete(Alice(), ids).success);
  EXPECT_EQ(Get(Alice(), "{'limit':1}"), "5000: k5000@5000");
  ASSERT_TRUE(Record(60001, {"last"}, 2, 20'000));
  EXPECT_EQ(Get(Alice()), "2: k9999@9999 last@20000");
}

TEST_F(History, ManyAtOnce) {
  // Each process opens the database, some of them make it.
  std::vector<pid_t> children;
  for (int i = 0; i < 8; ++i) {
    children.push_back(fork());
    if (children.back() == 0) {
      _exit(Record(60001, {"shared", "own" + std::to_string(i)}, 0) ? 0 : 1);
    }
  }
  for (const pid_t child : children) {
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
  }
  EXPECT_EQ(Ask(Alice(), "get", FromText("{'limit':1}")).data["total"], 9);
}

TEST_F(History, SearchRecordsWhatIsTyped) {
  using maru::Preferences;
  Preferences(60001).Set("enable_history", true);
  Preferences(60001).Set("max_history_num", 2);
  const auto type = [](const std::string& keyword) {
    Json::Value params = FromText("{'search_weight_list':[],'indice':['private']}");
    params["keyword"] = keyword;
    const Answer answer = Ask(Alice(), "search", params);
    EXPECT_EQ(ToText(answer.data), "{'hits':[],'total':0}");
    EXPECT_EQ(answer.log.find("Failed to execute"), std::string::npos) << answer.log;
  };
  const auto keywords = [] {
    std::string text;
    const Answer answer = Ask(Alice(), "get", FromText("{'sort_by':'id'}"));
    for (const Json::Value& row : answer.data["historys"]) {
      text += row["keyword"].asString() + "|";
    }
    return text;
  };
  type(" first \n");
  type("");
  EXPECT_EQ(keywords(), "first|");
  type("second");
  type("  ");
  EXPECT_EQ(keywords(), "second||");
  Preferences(60001).Set("enable_history", false);
  type("third");
  EXPECT_EQ(keywords(), "second||");
}

TEST_F(History, DatabaseThatFails) {
  WriteFile(kDatabase, "no database at all, but long enough to be taken for one, nearly", 0600,
            60000);
  EXPECT_EQ(Get(Alice()), "9999");
  const Answer answer = Delete(Alice(), "1");
  EXPECT_EQ(answer.code, 9999);
  EXPECT_THAT(answer.log, HasSubstr("(Execute) Failed [!table.Delete(cond)], reason: "));
  const Ran table = AsService([](SearchHistoryTable& history) {
    Json::Value told;
    told["count"] = history.Count(Condition::Null());
    told["why"] = history.GetLastError();
    std::vector<SearchHistory> rows(3);
    told["all"] = history.GetAll(rows, Condition::Null(), SelectParam(0, 0, "", true));
    told["rows"] = static_cast<unsigned>(rows.size());
    return told;
  });
  EXPECT_EQ(table.value["count"], 0);
  EXPECT_THAT(table.value["why"].asString(), HasSubstr("not a database"));
  EXPECT_EQ(table.value["all"], false);
  EXPECT_EQ(table.value["rows"], 0);
  // What is searched meanwhile is there when the database is.
  EXPECT_TRUE(Record(60001, {"meanwhile"}));
  EXPECT_EQ(Get(Alice()), "9999");
  unlink(kDatabase);
  EXPECT_EQ(Get(Alice()), "1: meanwhile@1000");
}

TEST_F(History, JournalThatFails) {
  ASSERT_TRUE(Record(60001, {"before"}));
  EXPECT_EQ(Get(Alice()), "1: before@1000");
  std::filesystem::create_directory(kJournal);
  EXPECT_FALSE(Record(60001, {"nowhere"}));
  EXPECT_EQ(Get(Alice()), "1: before@1000");
  EXPECT_EQ(Delete(Alice(), "1").code, 9999);
  maru::Preferences(60001).Set("enable_history", true);
  const Answer search = Ask(
      Alice(), "search", FromText("{'search_weight_list':[],'indice':['private'],'keyword':'k'}"));
  EXPECT_TRUE(search.success);
  EXPECT_THAT(search.log, ContainsRegex("task\\.h:33 .*Failed to execute, 9999 "));
}

TEST_F(History, WhatIsNoSearchInTheJournalIsLeftOut) {
  ASSERT_TRUE(Record(60001, {"one\ntwo"}));
  std::string text;
  ASSERT_TRUE(maru::ReadWholeFile(kJournal, 1 << 20, text));
  const std::string garbage =
      "\n{}\n[1]\nnull\n{\"create_time\":1,\"keyword\":2,\"max\":0,\"uid\":60001}\n"
      "{\"create_time\":1,\"keyword\":\"x\",\"max\":0,\"uid\":-1}\n" +
      std::string(100, '\0') + "\n";
  // A line that was cut ends the file, too.
  WriteFile(kJournal, garbage + text + garbage + text.substr(0, 20), 0600, 60000);
  EXPECT_EQ(Get(Alice()), "1: one\ntwo@1000");
}

TEST_F(History, OneThatTheDatabaseRefusesKeepsBackNoOther) {
  ASSERT_TRUE(Record(60001, {"first"}));
  EXPECT_EQ(Get(Alice()), "1: first@1000");
  AsService([](SearchHistoryTable&) {
    maruseeker::db::DBSession::Instance()->Open()
        << "CREATE TRIGGER refuse AFTER INSERT ON search_history WHEN NEW.keyword = 'no' "
           "BEGIN SELECT RAISE(ABORT, 'refused'); END";
    return Json::Value();
  });
  ASSERT_TRUE(Record(60001, {"no"}));
  EXPECT_EQ(Get(Alice()), "1: first@1000");
  ASSERT_TRUE(Record(60001, {"yes", "no", "last"}, 2, 2000));
  EXPECT_EQ(Get(Alice()), "2: yes@2000 last@2002");
  ASSERT_TRUE(Record(60001, {"no"}, 1, 3000));
  EXPECT_EQ(Get(Alice()), "2: yes@2000 last@2002");
}

TEST_F(History, WhatIsNoTextIsForTheDatabaseToJudge) {
  const std::string nul("nul\0!", 5), byte = "\xff";
  ASSERT_TRUE(Record(60001, {"text", nul, byte}, 2));
  EXPECT_FALSE(std::filesystem::exists(kJournal));
  EXPECT_EQ(Get(Alice()), "2: " + nul + "@1001 " + byte + "@1002");
  AsService([](SearchHistoryTable&) {
    maruseeker::db::DBSession::Instance()->Open()
        << "CREATE TRIGGER refuse AFTER INSERT ON search_history WHEN CAST(NEW.keyword AS BLOB) = "
           "x'ff01' "
           "BEGIN SELECT RAISE(ABORT, 'refused'); END";
    return Json::Value();
  });
  EXPECT_FALSE(Record(60001, {byte + "\x01"}));
}

TEST_F(History, LongJournalIsTakenOverByWhoSearches) {
  std::vector<std::string> keywords;
  for (int i = 0; i < 300; ++i) keywords.push_back("keyword number " + std::to_string(i));
  ASSERT_TRUE(Record(60001, keywords, 250));
  EXPECT_TRUE(std::filesystem::exists(kDatabase));
  EXPECT_LT(std::filesystem::file_size(kJournal), 16u << 10);
  EXPECT_EQ(Ask(Alice(), "get", FromText("{'limit':1}")).data["total"], 250);
  EXPECT_FALSE(std::filesystem::exists(kJournal));
}

TEST_F(History, WhoSearchesDoesNotWaitForWhoReads) {
  ASSERT_TRUE(Record(60001, {"first"}));
  const std::string taken = std::string(kJournal) + ".taken";
  std::filesystem::rename(kJournal, taken);
  {
    const maru::UniqueFd file(open(taken.c_str(), O_RDWR | O_CLOEXEC));
    ASSERT_EQ(flock(file.Get(), LOCK_EX), 0);
    EXPECT_TRUE(Record(60001, {"second"}, 0, 2000));
  }
  // What a process that died had set aside is not lost.
  EXPECT_EQ(Get(Alice()), "2: first@1000 second@2000");
  EXPECT_FALSE(std::filesystem::exists(taken));
}

TEST_F(History, ManySearchAndReadAtOnce) {
  constexpr int kEach = 60;
  std::vector<pid_t> all;
  for (int writer = 0; writer < 4; ++writer) {
    all.push_back(fork());
    if (all.back() != 0) continue;
    const maruseeker::sdk::SDKCredentials service("MaruSeeker");
    bool good = true;
    for (int i = 0; i < kEach; ++i) {
      SearchHistoryTable table;
      SearchHistory query =
          Query(60001, std::to_string(writer) + "." + std::to_string(i), 1000 + i);
      good = table.UpdateWithTime(query, 0) && good;
      if (i % 7 == 0) good = table.Count(Condition::Null()) > 0 && good;
    }
    _exit(good ? 0 : 1);
  }
  for (const pid_t child : all) {
    int status = 1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
  }
  EXPECT_EQ(Ask(Alice(), "get", FromText("{'limit':1}")).data["total"], 4 * kEach);
}

}  // namespace
