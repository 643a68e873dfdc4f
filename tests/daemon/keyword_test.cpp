#include "daemon/language/keyword.h"

#include <gtest/gtest.h>

#include "daemon/core/arguments.h"
#include "daemon/language/clauses.h"
#include "daemon/language/criteria.h"
#include "daemon/language/query_tree.h"
#include "daemon/language/range.h"
#include "index/store/fields.h"
#include "system/json.h"

namespace maru::daemon {
namespace {

/// The query as text, without the field behind each word.
std::string Read(const std::string& keyword, bool any_word = false) {
  const auto query = ParseKeyword(keyword, {{"F", 1}}, any_word);
  if (!query) return "blank";
  std::string text = Explain(*query);
  for (std::size_t at; (at = text.find("@F:1")) != std::string::npos;) text.erase(at, 4);
  return text;
}

struct Reading {
  const char* keyword;
  const char* query;
};

TEST(Keyword, MeansWhatTheSearchLanguageSays) {
  for (const auto& [keyword, query] : std::initializer_list<Reading>{
           {"harbour", "harbour"},
           {"old Harbour", "(old AND harbour)"},
           {"old AND harbour", "(old AND harbour)"},
           {"\"old harbour\"", "\"old harbour\""},
           {"\"harbour\"", "\"harbour\""},
           {"harb*", "harb*"},
           {"foo_bar", "\"foo bar\""},
           {"日本語", "\"日 本 語\""},
           {"annual_rep*", "(\"annual\" AND rep*)"},
           {"holiday photo OR video", "(holiday AND (photo OR video))"},
           {"holiday | trip", "(holiday OR trip)"},
           {"harbour -boat", "(harbour WITHOUT (boat))"},
           {"-boat", "(everything WITHOUT (boat))"},
           {"-\"old boat\" harbour", "(harbour WITHOUT (\"old boat\"))"},
           {"a -(b OR c)", "(a WITHOUT ((b OR c)))"},
           {"a OR -b", "(a OR (everything WITHOUT (b)))"},
           {"(a b) OR (c d)", "((a AND b) OR (c AND d))"},
           {"a (-b c)", "(a AND (c WITHOUT (b)))"},
           {"well-known", "\"well known\""},
           // Malformed: taken literally.
           {"\"old harbour", "(old AND harbour)"},
           {"(old harbour", "(old AND harbour)"},
           {"old) harbour", "(old AND harbour)"},
           {"OR", "or"},
           {"old OR", "(old AND or)"},
           {"OR old", "(or AND old)"},
           {"(AND old)", "(and AND old)"},
           {"old - harbour", "(old AND harbour)"},
           {"--old", "old"},
           {"-(", "nothing"},
           {"a OR -(", "a"},
           {"-( -a", "(everything WITHOUT (a))"},
           {"()", "nothing"},
           {"* ?! harbour", "harbour"},
           {"*", "nothing"},
           {"\"", "nothing"},
           {" \t ", "blank"},
           {"", "blank"},
       }) {
    EXPECT_EQ(Read(keyword), query) << keyword;
  }
}

TEST(Keyword, AnyWordTurnsTheOperatorsRound) {
  EXPECT_EQ(Read("a b", true), "(a OR b)");
  EXPECT_EQ(Read("a b AND c", true), "(a OR (b AND c))");
  EXPECT_EQ(Read("a b -c", true), "((a OR b) WITHOUT (c))");
  EXPECT_EQ(Read("a ?!", true), "a");
}

unsigned Depth(const index::Query& query) {
  unsigned deepest = 0;
  for (const index::Query& part : query.parts) deepest = std::max(deepest, Depth(part));
  return deepest + 1;
}

TEST(Keyword, IsBounded) {
  std::string deep;
  for (int i = 0; i < 20; ++i) deep += "(a -(b OR ";
  for (const bool any_word : {false, true}) {
    EXPECT_LE(Depth(*ParseKeyword(deep, {{"F", 1}}, any_word)), index::Query::kMaxDepth);
    EXPECT_LE(Depth(*ParseKeyword(deep + std::string(40, ')'), {{"F", 1}}, any_word)),
              index::Query::kMaxDepth);
  }
  std::string words;
  for (int i = 0; i < 64; ++i) words += "w ";
  EXPECT_NO_THROW(Read(words));
  EXPECT_THROW(Read(words + "w"), maruseeker::Error);
  for (int i = 1; i < 8; ++i) words += words.substr(0, 128);
  EXPECT_NO_THROW(Read('"' + words + '"'));
  EXPECT_THROW(Read('"' + words + "w\""), maruseeker::Error);
  EXPECT_THROW(Read(std::string(5000, 'a')), maruseeker::Error);
}

TEST(Criteria, AreReadByTheFieldsType) {
  const auto read = [](std::string_view field, const std::string& value) {
    const auto query = ParseCriterion(*index::FindField(field), value);
    return query ? Explain(*query) : std::string("blank");
  };
  EXPECT_EQ(read(index::kName, "trip*"), "trip*@MARUMDFSName:1");
  EXPECT_EQ(read(index::kExtension, ".JPG OR \"PNG\""),
            "(MARUMDExtension=jpg OR MARUMDExtension=png)");
  EXPECT_EQ(read(index::kOwner, "root OR 12"), "(MARUMDOwnerUserID=0 OR MARUMDOwnerUserID=12)");
  EXPECT_EQ(read(index::kOwner, "no such user"), "nothing");
  EXPECT_EQ(read(index::kKind, "image, Video"), "(MARUMDKind=image OR MARUMDKind=video)");
  EXPECT_EQ(read(index::kIsDir, "true"), "MARUMDIsDir=1");
  EXPECT_EQ(read(index::kPath, "/photo/trip/"), "under /volume1/photo/trip");
  EXPECT_EQ(read(index::kPath, "/volume1/photo//trip"), "under /volume1/photo/trip");
  EXPECT_EQ(read(index::kPath, "/volume10"), "under /volume1/volume10");
  EXPECT_EQ(read(index::kPath, "/"), "everything");
  EXPECT_EQ(read(index::kPath, "/volume1"), "everything");
  EXPECT_EQ(read(index::kSize, "1.5k..2MB"), "MARUMDFSSize=1536..2097152");
  EXPECT_EQ(read(index::kSize, " "), "blank");
  for (const auto& [field, value] : std::initializer_list<Reading>{{"MARUMDKind", "imge"},
                                                                   {"MARUMDIsDir", "yes"},
                                                                   {"MARUMDPath", "/photo/../etc"},
                                                                   {"MARUMDPath", "/photo/./a"},
                                                                   {"MARUMDPath", "photo"},
                                                                   {"MARUMDFSSize", "big"},
                                                                   {"MARUMDModTime", "2026-13"}}) {
    EXPECT_THROW(read(field, value), maruseeker::Error) << field << " " << value;
  }
  EXPECT_THROW(read(index::kPath, std::string("/photo\0a", 8)), maruseeker::Error);
  EXPECT_THROW(read(index::kExtension, std::string(201, 'x')), maruseeker::Error);
  for (const auto& [field, value] :
       std::initializer_list<Reading>{{"MARUMDKind", "image"}, {"MARUMDExtension", "jpg"}}) {
    std::string many = value;
    for (std::size_t i = 1; i < kMaxAlternatives; ++i) many += std::string(" OR ") + value;
    EXPECT_NO_THROW(read(field, many));
    EXPECT_THROW(read(field, many + " OR " + value), maruseeker::Error) << field;
  }
}

TEST(Ranges, OfSizesAndTimes) {
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  const auto is = [](const std::optional<Range>& range, double low, double high) {
    return range && range->low == low && range->high == high;
  };
  EXPECT_TRUE(is(ParseSizeRange("10"), 10, 10));
  EXPECT_TRUE(is(ParseSizeRange("10 KiB .. 1m"), 10240, 1048576));
  EXPECT_TRUE(is(ParseSizeRange("7 B..7b"), 7, 7));
  EXPECT_TRUE(is(ParseSizeRange(">10"), 11, kInfinity));
  EXPECT_TRUE(is(ParseSizeRange(">1.5"), 2, kInfinity));
  EXPECT_TRUE(is(ParseSizeRange("< 1.5"), -kInfinity, 1));
  EXPECT_TRUE(is(ParseSizeRange("<=2k"), -kInfinity, 2048));
  EXPECT_TRUE(is(ParseSizeRange("5.."), 5, kInfinity));
  for (const char* bad : {"..", "", "9..1", "-5", "inf", "nan", "1e9", "5 XB", "1..2..3", ">"}) {
    EXPECT_FALSE(ParseSizeRange(bad)) << bad;
  }
  EXPECT_TRUE(is(ParseTimeRange("2026-03-01T00:00:00Z"), 1772323200, 1772323200));
  EXPECT_TRUE(is(ParseTimeRange("2026-03-01 02:30+02:30"), 1772323200, 1772323259));
  EXPECT_TRUE(is(ParseTimeRange("2026-02-28T21:30-02:30"), 1772323200, 1772323259));
  EXPECT_TRUE(is(ParseTimeRange("@1..@5"), 1, 5));
  EXPECT_TRUE(is(ParseTimeRange("@5.."), 5, kInfinity));
  setenv("TZ", "UTC", 1);
  tzset();
  EXPECT_TRUE(is(ParseTimeRange("2026"), 1767225600, 1798761599));
  EXPECT_TRUE(is(ParseTimeRange("2024-02"), 1706745600, 1709251199)) << "a leap year";
  EXPECT_TRUE(is(ParseTimeRange("2026-02-28..2026-03-01"), 1772236800, 1772409599));
  EXPECT_TRUE(is(ParseTimeRange(">2026"), 1798761600, kInfinity));
  EXPECT_TRUE(is(ParseTimeRange(">=2026"), 1767225600, kInfinity));
  EXPECT_TRUE(is(ParseTimeRange("<2026"), -kInfinity, 1767225599));
  EXPECT_TRUE(is(ParseTimeRange("<=2026"), -kInfinity, 1798761599));
  for (const char* bad :
       {"26", "2026-02-30", "2026-00", "2026-13", "2026-03-00", "2026-3-1T25:00", "2026-03-01T10",
        "2026-03-01T24:00", "2026-03-01T10:60", "2026-03-01T10:00:60", "2026-03-01T10:00+99:00",
        "2026-03-01T10:00+01:75", "@x", "@5x", "2026..2025", "yesterday", "20260301"}) {
    EXPECT_FALSE(ParseTimeRange(bad)) << bad;
  }
  setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
  tzset();
  EXPECT_TRUE(is(ParseTimeRange("2026-07-01"), 1782856800, 1782943199)) << "in summer time";
}

TEST(Clauses, WeightsFieldsAndRefusesWhatIsUnknown) {
  const auto read = [](const std::string& text) {
    Json::Value value;
    EXPECT_TRUE(json::FromString(text, value)) << text;
    const Arguments arguments(value, "data",
                              {"keyword", "criteria_list", "file_type", "search_weight_list"});
    return Explain(ToQuery(ReadClauses(arguments), false));
  };
  EXPECT_EQ(read(R"({"keyword": "a", "search_weight_list": [{"field": "MARUMDFSName", "weight": 9},
                     {"field": "MARUMDTextContent", "weight": 0},
                     {"field": "MARUMDTitle", "weight": 0.5}]})"),
            "a@MARUMDAuthors:2,MARUMDFSName:9,MARUMDTitle:0.5");
  EXPECT_EQ(read(R"({})"), "nothing");
  EXPECT_EQ(read(R"({"keyword": " ", "file_type": "all"})"), "nothing");
  EXPECT_EQ(read(R"({"keyword": " ", "file_type": "image"})"),
            "(everything ONLY (MARUMDKind=image))");
  EXPECT_EQ(read(R"({"keyword": "---", "file_type": "image"})"),
            "(nothing ONLY (MARUMDKind=image))");
  EXPECT_EQ(read(R"({"keyword": "a", "search_weight_list": [{"field": "MARUMDFSName", "weight": 0},
                     {"field": "MARUMDTextContent", "weight": 0},
                     {"field": "MARUMDTitle", "weight": 0}, {"field": "MARUMDAuthors",
                     "weight": 0}]})"),
            "nothing");
  EXPECT_EQ(read(R"({"criteria_list": [{"field": "MARUMDTitle", "value": "x"}], "keyword": "a",
                     "search_weight_list": [{"field": "MARUMDFSName", "weight": 0},
                     {"field": "MARUMDTextContent", "weight": 0},
                     {"field": "MARUMDTitle", "weight": 0}]})"),
            "(a@MARUMDAuthors:2 AND x@MARUMDTitle:1)");
  EXPECT_EQ(read(R"({"criteria_list": [{"field": "MARUMDTitle", "value": "x y"}]})"),
            "(x@MARUMDTitle:1 AND y@MARUMDTitle:1)");
  for (const char* bad : {
           R"({"keyword": 5})",
           R"({"keywords": "a"})",
           R"({"search_weight_list": [{"field": "MARUMDFSName", "weight": -1}]})",
           R"({"search_weight_list": [{"field": "MARUMDFSName", "weight": 1001}]})",
           R"({"search_weight_list": [{"field": "MARUMDFSName", "weight": "9"}]})",
           R"({"search_weight_list": [{"field": "MARUMDFSName"}]})",
           R"({"search_weight_list": [{"field": "MARUMDFSSize", "weight": 1}]})",
           R"({"search_weight_list": [{"field": "Name", "weight": 1}]})",
           R"({"search_weight_list": ["MARUMDFSName"]})",
           R"({"criteria_list": [{"field": "nope", "value": "1"}]})",
           R"({"criteria_list": {"field": "MARUMDTitle"}})",
           R"({"file_type": "pictures"})",
       }) {
    EXPECT_THROW(read(bad), maruseeker::Error) << bad;
  }
}

}  // namespace
}  // namespace maru::daemon
