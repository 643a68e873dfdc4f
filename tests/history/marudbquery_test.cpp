#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "history/database.h"
#include "tests/support/support.h"

struct Row : marudbquery::Insertable, marudbquery::Updatable {
  Row() = default;
  Row(long long u, std::string k, long long t = 0) : uid(u), keyword(std::move(k)), time(t) {}

  marudbquery::Values InsertValues() const override {
    return {{"uid", uid}, {"keyword", keyword}, {"create_time", time}};
  }
  marudbquery::Values UpdateValues() const override { return {{"create_time", time}}; }

  long long id = 0;
  long long uid = 0;
  std::string keyword;
  long long time = 0;
};

template <>
struct soci::type_conversion<Row> {
  using base_type = soci::values;
  static void from_base(const soci::values& values, soci::indicator, Row& row) {
    row.id = values.get<int>("id");
    row.uid = values.get<long long>("uid");
    row.keyword = values.get<std::string>("keyword");
    row.time = values.get<long long>("create_time");
  }
};

namespace {

using namespace marudbquery;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* kTable = "search_history";

class Database : public testing::Test {
 protected:
  void SetUp() override { Configure(folder_); }

  static Condition Uid(unsigned int uid) {
    return Condition::ConditionFactory<unsigned int>("uid", "=", uid);
  }
  static Condition Id(int id) { return Condition::ConditionFactory<int>("id", "=", id); }

  bool Insert(const Row& row) {
    InsertStatement insert(&session_, kTable);
    const bool done = insert.Execute(row);
    error_ = insert.GetLastError();
    return done;
  }
  int Count(const Condition& condition) {
    SelectStatement select(&session_, kTable);
    int count = 0;
    select.SetCondition(Condition::Null() && condition);
    select.Select("COUNT(*)", count);
    if (!select.Execute(true)) count = -1;
    error_ = select.GetLastError();
    return count;
  }
  std::vector<std::string> Keywords(const Condition& condition, const std::string& order = "",
                                    int offset = 0, int limit = 0) {
    SelectStatement select(&session_, kTable);
    select.SetCondition(condition);
    select.OrderBy(order, kDescending);
    select.SetOffset(offset);
    select.SetLimit(limit);
    Row row;
    select.SelectAll(row);
    std::vector<std::string> keywords;
    if (!select.Execute(false)) keywords.push_back("failed");
    while (select.Fetch()) keywords.push_back(row.keyword);
    error_ = select.GetLastError();
    return keywords;
  }

  static constexpr const char* kSchema =
      "CREATE TABLE IF NOT EXISTS search_history (id INTEGER PRIMARY KEY AUTOINCREMENT,"
      " uid BIGINT NOT NULL, keyword TEXT NOT NULL, create_time BIGINT NOT NULL);"
      "CREATE INDEX IF NOT EXISTS by_user ON search_history (uid)";
  TempFolder folder_;
  Session session_{"sqlite3://" + (folder_ / "test.db"), kSchema};
  std::string error_;
};

TEST_F(Database, KeepsValuesWhole) {
  const std::string odd("nul\0 %_'\"; \xff\xf0", 14);
  ASSERT_TRUE(Insert({4'000'000'000, odd, 5'000'000'000})) << error_;
  SelectStatement select(&session_, kTable);
  Row row;
  select.SelectAll(row);
  ASSERT_TRUE(select.Execute(true)) << select.GetLastError();
  EXPECT_EQ(row.keyword, odd);
  EXPECT_EQ(row.uid, 4'000'000'000);
  EXPECT_EQ(row.time, 5'000'000'000);
  EXPECT_FALSE(select.Fetch());
  EXPECT_EQ(select.GetLastError(), "");
  EXPECT_EQ(Count(Uid(4'000'000'000)), 1);
  EXPECT_EQ(Count(Condition::ConditionFactory<std::string>("keyword", "=", odd)), 1);
}

TEST_F(Database, FindsTextLiterally) {
  for (const char* keyword : {"100% sure", "a_b", "axb", "It's", "ABC", ""}) Insert({1, keyword});
  const auto has = [&](const std::string& text) {
    return Keywords(Condition::HasSubstring("keyword", text));
  };
  EXPECT_THAT(has("%"), ElementsAre("100% sure"));
  EXPECT_THAT(has("a_b"), ElementsAre("a_b"));
  EXPECT_THAT(has("'"), ElementsAre("It's"));
  EXPECT_THAT(has("bc"), ElementsAre());
  EXPECT_EQ(has("").size(), 6u);
}

TEST_F(Database, PagesNeverOverlap) {
  for (int i = 0; i < 9; ++i) Insert({1, std::to_string(i), i / 3});
  EXPECT_THAT(Keywords(Uid(1), "create_time", 0, 4), ElementsAre("8", "7", "6", "5"));
  EXPECT_THAT(Keywords(Uid(1), "create_time", 4, 4), ElementsAre("4", "3", "2", "1"));
  EXPECT_THAT(Keywords(Uid(1), "create_time", 8, 0), ElementsAre("0"));
  EXPECT_THAT(Keywords(Uid(1), "", -1, -1).size(), 9);
}

TEST_F(Database, RefusesWhatTheTableLacks) {
  Insert({1, "a"});
  EXPECT_THAT(Keywords(Uid(1), "nope"), ElementsAre("failed"));
  EXPECT_EQ(Count(Condition::HasSubstring("nope", "a")), -1);
  EXPECT_EQ(error_, "no such column: nope");
  EXPECT_THAT(Keywords(Uid(1), "id\"; DROP TABLE search_history; --"), ElementsAre("failed"));
  EXPECT_EQ(Count(Condition::ConditionFactory<int>("ID", "=", 1)), -1);
  EXPECT_EQ(Count(Condition::ConditionFactory<int>("id", "= 1 OR 1 =", 1)), -1);
  EXPECT_THAT(error_, HasSubstr("no such operator"));
  DeleteStatement elsewhere(&session_, "sqlite_master");
  elsewhere.SetCondition(Id(1));
  EXPECT_FALSE(elsewhere.Execute());
  InsertStatement nowhere(&session_, "none");
  EXPECT_FALSE(nowhere.Execute(Row(1, "a")));
  EXPECT_EQ(Count(Uid(1)), 1);
}

TEST_F(Database, NullConditionsAreNeutral) {
  Insert({1, "a"});
  Insert({2, "b"});
  const Condition null = Condition::Null();
  EXPECT_EQ(Count(null), 2);
  EXPECT_EQ(Count(null || Uid(1)), 1);
  EXPECT_EQ(Count((Uid(1) || null) && null), 1);
  EXPECT_EQ(Count(Uid(1) && (null || Id(1) || Id(2))), 1);
  // But never the reason to lose everything.
  DeleteStatement all(&session_, kTable);
  all.SetCondition(null && null);
  EXPECT_FALSE(all.Execute());
  UpdateStatement update(&session_, kTable);
  EXPECT_FALSE(update.Execute(Row(0, "", 7)));
  EXPECT_EQ(Count(null), 2);
}

TEST_F(Database, UpdatesSayHowManyRowsChanged) {
  Insert({1, "a"});
  Insert({1, "b"});
  long long changed = -1;
  UpdateStatement update(&session_, kTable);
  update.SetCondition(Uid(1));
  ASSERT_TRUE(update.Execute(Row(0, "", 7), &changed));
  EXPECT_EQ(changed, 2);
  update.SetCondition(Uid(2));
  ASSERT_TRUE(update.Execute(Row(0, "", 7), &changed));
  EXPECT_EQ(changed, 0);
  EXPECT_EQ(Count(Condition::ConditionFactory<long long>("create_time", "=", 7)), 2);
}

TEST_F(Database, JoinsThousandsOfConditions) {
  for (int i = 0; i < 3; ++i) Insert({1, "a"});
  Condition ids = Condition::Null();
  for (int i = 20'000; i > 1; --i) ids = ids || Id(i);
  EXPECT_EQ(Count(Uid(1) && ids), 2) << error_;
  DeleteStatement statement(&session_, kTable);
  statement.SetCondition(Uid(1) && ids);
  EXPECT_TRUE(statement.Execute()) << statement.GetLastError();
  EXPECT_EQ(Count(Condition::Null()), 1);
}

TEST_F(Database, TransactionsHappenWhollyOrNot) {
  std::string error;
  EXPECT_TRUE(session_.Transaction([&] { return Insert({1, "a"}) && Insert({1, "b"}); }, error));
  EXPECT_FALSE(session_.Transaction([&] { return Insert({1, "c"}) && false; }, error));
  EXPECT_EQ(error, "");
  EXPECT_FALSE(session_.Transaction(
      [&]() -> bool {
        Insert({1, "d"});
        throw std::runtime_error("thrown");
      },
      error));
  EXPECT_EQ(error, "thrown");
  EXPECT_EQ(Count(Uid(1)), 2);
}

TEST_F(Database, AChildOpensItsOwn) {
  ASSERT_TRUE(Insert({1, "parent"}));
  EXPECT_EQ(StatusOfChild([this] {
              EXPECT_EQ(Count(Uid(1)), 1);
              EXPECT_TRUE(Insert({1, "child"})) << error_;
            }),
            0);
  EXPECT_TRUE(Insert({1, "parent again"}));
  EXPECT_EQ(Count(Uid(1)), 3);
}

/// None of them has seen the database before: they race for its very creation too.
TEST_F(Database, ManyProcessesWriteAtOnce) {
  constexpr int kProcesses = 16;
  constexpr int kRows = 40;
  std::vector<pid_t> children;
  for (int process = 0; process < kProcesses; ++process) {
    children.push_back(fork());
    if (children.back() != 0) continue;
    bool good = true;
    for (int i = 0; good && i < kRows; ++i) {
      std::string error;
      const Row row(process, std::to_string(i));
      good = i % 2 ? Insert(row)
                   : session_.Transaction([&] { return Count(Uid(1)) >= 0 && Insert(row); }, error);
      if (!good) std::cerr << error_ << " " << error << std::endl;
    }
    _exit(good ? 0 : 1);
  }
  for (const pid_t child : children) {
    int status = -1;
    waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
  }
  EXPECT_EQ(Count(Condition::Null()), kProcesses * kRows);
}

TEST_F(Database, AnUnusableOneIsAnErrorNotACrash) {
  const auto error_with = [](Session& session) {
    int count = 0;
    SelectStatement select(&session, kTable);
    select.Select("COUNT(*)", count);
    EXPECT_FALSE(select.Execute(true));
    std::string error;
    EXPECT_FALSE(session.Transaction([] { return true; }, error));
    return select.GetLastError();
  };
  Session garbage("sqlite3://" + folder_.Write("garbage.db", std::string(8192, 'g')), kSchema);
  EXPECT_NE(error_with(garbage), "");
  Session nowhere("sqlite3://" + (folder_ / "no/such/folder.db"), kSchema);
  EXPECT_NE(error_with(nowhere), "");
  Session server("postgresql://host=" + (folder_ / "none") + " dbname=x", kSchema);
  EXPECT_THAT(error_with(server), HasSubstr("connection to server"));
  Session unknown("mysql://x", kSchema);
  EXPECT_THAT(error_with(unknown), HasSubstr("sqlite3://"));
}

TEST_F(Database, TheHistoryHasItsTable) {
  EXPECT_EQ(StatusOfChild([] {
              Session* session = maruseeker::db::DBSession::Instance();
              EXPECT_EQ(session, maruseeker::db::DBSession::Instance());
              InsertStatement insert(session, kTable);
              EXPECT_TRUE(insert.Execute(Row(1, "a"))) << insert.GetLastError();
            }),
            0);
  EXPECT_TRUE(std::filesystem::exists(folder_ / "state/history.db"));
}

}  // namespace
