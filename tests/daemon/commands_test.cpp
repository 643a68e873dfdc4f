#include "common/error.h"
#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

class CommandsTest : public DaemonTest {
 protected:
  int DocumentId(const std::string& keyword) {
    Json::Value data;
    data["pre_query"]["keyword"] = keyword;
    const auto messages = Ask(root_user_, "search", data);
    EXPECT_EQ(messages.size(), 3u) << keyword;
    return messages.size() == 3 ? messages[1]["doc_id"].asInt() : 0;
  }

  /// "suggester: term" of each suggestion.
  Strings Suggestions(const Identity& who, const std::string& data) {
    Strings suggestions;
    const Json::Value reply = Data(who, "term_suggest", Parsed(data));
    for (const Json::Value& row : reply["suggestions"]) {
      suggestions.push_back(row["suggester"].asString() + ": " + row["term"].asString());
    }
    return suggestions;
  }

  std::string FirstHit(const Identity& who, const std::string& keyword) {
    Json::Value data;
    data["pre_query"]["keyword"] = keyword;
    data["load_field"].append("MARUMDFSName");
    const auto messages = Ask(who, "search", data);
    return messages.size() > 2 ? messages[1]["MARUMDFSName"].asString() : "";
  }
};

TEST_F(CommandsTest, HighlightIsForReadersOnly) {
  std::string far;
  for (int i = 0; i < 60; ++i) far += "filler ";
  File("photo/open.txt", "The <old> harbour & its boats; " + far + " Harbours!");
  File("photo/secret.txt", "palimpsest harbour", 0600, bin_.uid);
  Index();
  const auto ask = [&](int document, const std::string& more = "{}") {
    Json::Value data = Parsed(R"({"id": "fileindex_photo", "keyword": "harbour",
                                  "search_weight_list": []})");
    data["doc_id"] = document;
    data["highlight"] = Parsed(more);
    return data;
  };
  const int open = DocumentId("boats");
  const int secret = DocumentId("palimpsest");
  const Json::Value reply = Data(games_, "highlight", ask(open));
  EXPECT_EQ(reply["doc_id"].asInt(), open);
  const Json::Value& fragments = reply["fragments"]["MARUMDTextContent"];
  ASSERT_EQ(fragments.size(), 2u);
  EXPECT_NE(fragments[0].asString().find("&lt;old&gt; <mark>harbour</mark> &amp; its"),
            std::string::npos)
      << fragments[0].asString();
  EXPECT_EQ(fragments[1].asString().find("<mark>Harbours</mark>") != std::string::npos, true);
  EXPECT_EQ(
      Data(
          games_, "highlight",
          ask(open, R"({"num_fragments": 1, "frag_length": -5})"))["fragments"]["MARUMDTextContent"]
          .size(),
      1u);
  EXPECT_EQ(Code(bin_, "highlight", ask(secret)), 0);
  EXPECT_EQ(Ask(games_, "highlight", ask(secret)), Ask(games_, "highlight", ask(999)))
      << "what may not be read is as if it were not there";
  EXPECT_EQ(Code(games_, "highlight", ask(secret)), 507);
  EXPECT_EQ(Code(games_, "highlight", ask(-1)), 507);
  Json::Value unknown = ask(open);
  unknown["id"] = "fileindex_none";
  EXPECT_EQ(Code(root_user_, "highlight", unknown), 507);
  EXPECT_EQ(Code(games_, "highlight", ask(open, R"({"field": "MARUMDFSSize"})")), 120);
  EXPECT_EQ(Code(games_, "highlight", ask(open, R"({"num_fragments": "3"})")), 120);
  chmod((root_ + "/photo/open.txt").c_str(), 0600);
  EXPECT_EQ(Code(games_, "highlight", ask(open)), 507) << "a right taken away holds at once";
}

TEST_F(CommandsTest, SuggestsFromWhatTheCallerMayRead) {
  File("photo/palace.txt", "palimony palate");
  File("photo/secret.txt", "palimpsest pallbearer", 0600, bin_.uid);
  Index();
  history_[bin_.uid] = {"old palace", "palm trees", "Palm Trees", "beach"};  // newest first
  EXPECT_EQ(
      Suggestions(games_, R"({"uid": 5, "terms": "the pal"})"),
      (Strings{"completion: the palace", "completion: the palate", "completion: the palimony"}));
  EXPECT_EQ(Suggestions(bin_, R"({"uid": 2, "terms": "pal", "suggest_num": 4})"),
            (Strings{"history: palm trees", "completion: palace", "name: palace.txt",
                     "completion: palate"}));
  EXPECT_EQ(Suggestions(games_, R"({"uid": 2, "terms": "palm", "suggester": ["history"]})"),
            (Strings{}))
      << "another's history is not to be had";
  EXPECT_EQ(Suggestions(root_user_, R"({"uid": 2, "terms": "beach", "suggester": ["history"]})"),
            (Strings{}));
  EXPECT_EQ(Suggestions(root_user_, R"({"uid": 2, "terms": "bea", "suggester": ["history"]})"),
            (Strings{"history: beach"}));
  EXPECT_EQ(Suggestions(games_, R"({"terms": "palimny x"})"), (Strings{"spelling: palimony x"}));
  EXPECT_EQ(Suggestions(games_, R"({"terms": "palimpsets"})"), (Strings{}));
  EXPECT_EQ(Suggestions(bin_, R"({"terms": "palimpsets"})"), (Strings{"spelling: palimpsest"}));
  EXPECT_EQ(Suggestions(bin_, R"({"terms": "palimp", "indice": ["photo", "none"]})"),
            (Strings{"completion: palimpsest"}));
  EXPECT_EQ(Suggestions(bin_, R"({"terms": "palimp", "indice": []})"), (Strings{}));
  EXPECT_EQ(Suggestions(bin_, R"({"terms": "?!"})"), (Strings{}));
  EXPECT_EQ(Code(bin_, "term_suggest", Parsed(R"({"terms": "a", "suggester": ["psychic"]})")), 120);
  const Json::Value list = Data(bin_, "list_term_sugg_db", Json::objectValue);
  EXPECT_EQ(list["suggesters"].size(), 4u);
  EXPECT_EQ(list["indices"], Parsed(R"(["fileindex_photo"])"));
}

TEST_F(CommandsTest, AFaultEndsInAnErrorThatTellsNothingMore) {
  const auto fault = [&] {
    const Json::Value data = Parsed(R"({"terms": "a", "suggester": ["history"]})");
    return json::ToString(Ask(bin_, "term_suggest", data).back()["error"]);
  };
  core_.history = [](uid_t) -> Strings { throw std::runtime_error("in /secret/place"); };
  EXPECT_EQ(fault(), R"({"code":117,"msg":"Internal error"})");
  core_.history = [](uid_t) -> Strings {
    throw maruseeker::Error(maruseeker::kErrorDaemonExchange, "It is gone");
  };
  EXPECT_EQ(fault(), R"({"code":121,"msg":"It is gone"})");
}

TEST_F(CommandsTest, IndicateCountsEachTypeOnItsOwn) {
  File("photo/a.txt", "harbour boat");
  File("photo/b.md", "harbour");
  File("photo/c.mp3", "harbour");
  File("photo/d.mp3", "harbour", 0600, games_.uid);
  Index();
  // As askers send it: each query carries the filters of those before it, too.
  const char* request = R"({"keyword": "harbour", "criteria_list": [], "search_weight_list": [],
    "indice": ["fileindex_photo"], "queries": [
      {"name": "document", "query": {"default_search_op": "AND", "filters": [
        {"name": "permission", "data": "bin"}, {"name": "file_type", "data": "document"}]}},
      {"name": "audio", "query": {"default_search_op": "AND", "filters": [
        {"name": "permission", "data": "bin"}, {"name": "file_type", "data": "document"},
        {"name": "permission", "data": "bin"}, {"name": "file_type", "data": "audio"}]}},
      {"name": "all", "query": {"filters": [{"name": "file_type", "data": "all"}]}}]})";
  EXPECT_EQ(Told(bin_, "indicate", Parsed(request)), R"({"all":3,"audio":1,"document":2})");
  EXPECT_EQ(Told(root_user_, "indicate", Parsed(request)), R"({"all":4,"audio":1,"document":2})");
  EXPECT_EQ(Told(games_, "indicate", Parsed(request)), R"({"all":4,"audio":0,"document":0})");
  const auto with = [&](const char* member, const Json::Value& value) {
    Json::Value data = Parsed(request);
    data[member] = value;
    return data;
  };
  EXPECT_EQ(Told(bin_, "indicate", with("keyword", " ")), R"({"all":0,"audio":1,"document":2})");
  EXPECT_EQ(Told(bin_, "indicate", with("indice", Json::arrayValue)),
            R"({"all":0,"audio":0,"document":0})");
  EXPECT_EQ(Told(bin_, "indicate", with("queries", Json::nullValue)), "{}");
  EXPECT_EQ(Told(bin_, "indicate", with("criteria_list", Parsed(R"([{"field": "MARUMDTextContent",
                                                             "value": "boat"}])"))),
            R"({"all":1,"audio":0,"document":1})");
  EXPECT_EQ(Code(bin_, "indicate", with("queries", Parsed(R"([{"query": {}}])"))), 120);
}

TEST_F(CommandsTest, WhatWasOpenedRanksHigher) {
  for (const char* name : {"a1.txt", "a2.txt", "a3.txt", "a4.txt"}) {
    File(std::string("photo/") + name, "harbour of equal words");
  }
  File("photo/secret.txt", "harbour", 0600, bin_.uid);
  Index();
  const std::string first = FirstHit(games_, "equal");
  const std::string other = first == "a3.txt" ? "a2.txt" : "a3.txt";
  const auto open = [&](const Identity& who, const std::string& path,
                        const std::string& id = "fileindex_photo") {
    Json::Value data;
    data["id"] = id;
    data["full_path"] = path;
    return Code(who, "record_spotlight_open", data);
  };
  EXPECT_EQ(open(games_, "/volume1/photo/" + other), 0);
  EXPECT_EQ(FirstHit(games_, "equal"), other);
  EXPECT_EQ(FirstHit(bin_, "equal"), first) << "what others open is not told";
  const std::string third = first == "a4.txt" || other == "a4.txt" ? "a1.txt" : "a4.txt";
  EXPECT_EQ(open(bin_, "/volume1/photo/" + third), 0);
  EXPECT_EQ(FirstHit(bin_, "equal"), third);
  EXPECT_EQ(FirstHit(games_, "equal"), other);

  EXPECT_EQ(open(games_, "/volume1/photo/none.txt"), 507);
  EXPECT_EQ(open(games_, "/volume1/photo/secret.txt"), 507);
  EXPECT_EQ(open(bin_, "/volume1/photo/secret.txt"), 0);
  EXPECT_EQ(open(games_, "/volume1/photo"), 0) << "the share's own folder";
  EXPECT_EQ(open(games_, "/volume1/docs/a.txt"), 120) << "in another share";
  EXPECT_EQ(open(games_, "/volume1/none/a.txt", "fileindex_none"), 507);
  EXPECT_EQ(open(games_, "photo/a1.txt"), 120);
  EXPECT_EQ(open(games_, "/volume1/photo/a1.txt", "../photo"), 120);
}

}  // namespace
}  // namespace maru::daemon::test
