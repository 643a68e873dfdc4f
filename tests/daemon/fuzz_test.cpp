#include <iterator>
#include <random>
#include <sstream>

#include "tests/daemon/fixture.h"

namespace maru::daemon::test {
namespace {

/// One request of every command, with every member; the document by its number.
const char* const kCorpus[] = {
    R"-({"command":"search","data":{"pre_query":{"keyword":"old \"harbour boats\" -sun OR (lake*)",
"criteria_list":[{"field":"MARUMDFSSize","value":"1k..2MB"},{"field":"MARUMDModTime","value":
">=2020-01-01"},{"field":"MARUMDPath","value":"/photo/trip"}],"file_type":"document,image",
"search_weight_list":[{"field":"MARUMDTitle","weight":2.5}]},"indice":["fileindex_photo"],
"from":0,"size":20,"default_search_op":"AND","load_field":["MARUMDPath","MARUMDFSName"],
"lazy_field":["MARUMDTextContent"],"fields":["MARUMDKind"],"collector":{"agent":"a","uid":2,
"has_criteria":true},"highlight":[{"field":"MARUMDTextContent","frag_length":50,
"num_fragments":2}],"filters":[{"name":"permission","data":"bin"}],
"sort":{"field":"MARUMDFSSize","direction":"ASC"}}})-",
    R"-({"command":"highlight","data":{"id":"fileindex_photo","doc_id":@,"highlight":{"field":
"MARUMDTextContent","frag_length":40,"num_fragments":3},"keyword":"harbour","search_weight_list":
[]}})-",
    R"-({"command":"term_suggest","data":{"uid":2,"terms":"old harb","suggest_num":5,"indice":
["fileindex_photo"],"suggester":["completion","name","spelling","history"]}})-",
    R"-({"command":"list_term_sugg_db","data":{}})-",
    R"-({"command":"indicate","data":{"keyword":"harbour","indice":["fileindex_photo"],
"criteria_list":[],"search_weight_list":[],"queries":[{"name":"image","query":{"filters":[{"name":
"permission","data":"bin"},{"name":"file_type","data":"image"}],"default_search_op":"AND"}}]}})-",
    R"-({"command":"record_spotlight_open","data":{"id":"fileindex_photo","full_path":
"/volume1/photo/trip/a.txt"}})-",
    R"-({"command":"status","data":{}})-",
    R"-({"command":"explain","data":{"pre_query":{"keyword":"a OR -b"}}})-",
};

/// Separated by blanks.
const std::string kPieces =
    "\" { } [ ] , : null -1 1e999 0.5 true \\u0000 \\ud800 ../ / \x80 \xff ((((( ))))) OR - * .. "
    "日本語 \"\" 99999999999999999999 MARUMDOwnerUserID MARUMDIsDir search homes \\\" fileindex_ "
    "permission file_type root";

std::vector<std::string> Pieces() {
  std::istringstream stream(kPieces);
  return {std::istream_iterator<std::string>(stream), {}};
}

std::vector<std::string> Corpus(std::uint32_t document) {
  std::vector<std::string> corpus(std::begin(kCorpus), std::end(kCorpus));
  for (std::string& request : corpus) {
    const std::size_t at = request.find('@');
    if (at != std::string::npos) request.replace(at, 1, std::to_string(document));
  }
  return corpus;
}

class Mutator {
 public:
  explicit Mutator(std::vector<std::string> corpus) : corpus_(std::move(corpus)) {}

  std::string Next() {
    std::string text = corpus_[Below(corpus_.size())];
    const std::size_t changes = Below(4);
    for (std::size_t i = 0; i <= changes; ++i) {
      if (Below(2)) {
        ReplaceValue(text);
      } else {
        Change(text);
      }
    }
    return text;
  }

 private:
  std::size_t Below(std::size_t bound) { return random_() % std::max<std::size_t>(bound, 1); }

  void Change(std::string& text) {
    const std::size_t at = Below(text.size());
    switch (Below(5)) {
      case 0:
        text.insert(at, pieces_[Below(pieces_.size())]);
        break;
      case 1:
        text.erase(at, 1 + Below(8));
        break;
      case 2:
        if (!text.empty()) text[at] = static_cast<char>(random_());
        break;
      case 3: {
        const std::string other = corpus_[Below(corpus_.size())];
        text = text.substr(0, at) + other.substr(Below(other.size()));
        break;
      }
      default:
        text.insert(at, text.substr(Below(text.size()), Below(200)));
    }
  }

  /// One string of the text becomes another value: the text stays JSON, so that the mutation gets
  /// past the parser.
  void ReplaceValue(std::string& text) {
    const std::size_t begin = text.find('"', Below(text.size()));
    if (begin == std::string::npos) return;
    const std::size_t end = text.find('"', begin + 1);
    if (end == std::string::npos) return;
    const std::string inside = pieces_[Below(pieces_.size())];
    const std::string values[] = {"\"" + inside + "\"", "null", "[]", "{}", "-7", "1.5", "false"};
    text.replace(begin, end + 1 - begin, values[Below(std::size(values))]);
  }

  const std::vector<std::string> corpus_;
  const std::vector<std::string> pieces_ = Pieces();
  std::mt19937 random_{1977};
};

TEST_F(DaemonTest, AnswersWhateverComes) {
  File("photo/trip/a.txt", "old harbour boats");
  File("photo/lake.jpg", "sun");
  Index();
  history_[bin_.uid] = {"old harbour"};
  const auto view = indices_.Open({{"fileindex_photo", {0, {}, true}}}, nullptr);
  const std::vector<std::string> corpus = Corpus(view->Find(0, "/trip/a.txt")->alias);
  for (const std::string& request : corpus) {
    EXPECT_TRUE(Say(bin_, request).back()["success"].asBool())
        << request << json::ToString(Say(bin_, request).back());
  }
  Mutator mutator(corpus);
  int understood = 0;
  for (int round = 0; round < 6000; ++round) {
    const std::string line = mutator.Next();
    const auto messages = Say(round % 3 ? bin_ : root_user_, line);
    ASSERT_FALSE(messages.empty()) << line;
    const Json::Value& last = messages.back();
    ASSERT_TRUE(last["success"].isBool()) << line;
    understood += last["success"].asBool();
    if (last["success"].asBool()) continue;
    ASSERT_NE(last["error"]["code"].asInt(), 117) << line << json::ToString(last);
    ASSERT_FALSE(last["error"]["msg"].asString().empty()) << line;
  }
  EXPECT_GT(understood, 100);
}

}  // namespace
}  // namespace maru::daemon::test
