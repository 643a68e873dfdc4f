#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

#include "plugin/plugin.h"
#include "support/fake_daemon.h"

namespace {

using testing::ContainsRegex;
using testing::HasSubstr;

/// A method that asks the daemon once.
struct Method {
  const char* name;
  const char* command;
  const char* params;
  /// Where its log lines come from.
  const char* place;
  const char* function;
  const char* send_failure;
  /// What it answers while the socket file is missing; null: error 605.
  const char* without_socket;
  bool judges;
};

constexpr const char* kSearchJson = "Cannot send search json to maruelastic daemon";
const Method kMethods[] = {
    {"highlight", "highlight",
     "{'full_path':'/volume1/photo/trip/a.jpg','doc_id':7,'highlight':{'search_weight_list':[1]},"
     "'keyword':'k'}",
     "highlight\\.cpp", "Execute", kSearchJson, nullptr, true},
    {"suggest", "term_suggest", "{'terms':'k'}", "term\\.cpp", "SendToDaemon", kSearchJson, "null",
     true},
    {"list_avail_db", "list_term_sugg_db", "{}", "term\\.cpp", "SendToDaemon", kSearchJson, "null",
     true},
    {"indicate", "indicate",
     "{'search_weight_list':[],'criteria_list':[],'keyword':'k','file_type':['a','b']}",
     "indicate\\.cpp", "Execute", kSearchJson, "{'a':0,'b':0}", false},
    {"boost", "record_spotlight_open", "{'full_path':'/volume1/photo/trip/a.jpg'}",
     "spotlight\\.cpp", "Execute", "Cannot send json to maruelastic daemon", nullptr, false},
};

class Methods : public PluginTest {
 protected:
  static Answer AskWith(const Method& method, FakeDaemon::Script script) {
    FakeDaemon daemon;
    daemon.On(method.command, std::move(script));
    return Ask(Alice(), method.name, FromText(method.params));
  }

  /// The request that a good exchange sends.
  static std::string Sent(const Login& login, const char* name, const std::string& params) {
    FakeDaemon daemon;
    for (const Method& method : kMethods) {
      daemon.On(method.command, {FakeDaemon::Message("{\"success\":true}")});
    }
    EXPECT_TRUE(Ask(login, name, FromText(params)).success);
    const auto requests = daemon.Requests();
    return requests.size() == 1 ? requests[0].text : "not one request";
  }
};

TEST_F(Methods, Requests) {
  EXPECT_EQ(Sent(Alice(), "highlight", kMethods[0].params),
            R"({"command":"highlight","data":{"doc_id":7,"highlight":{"search_weight_list":[1]},)"
            R"("id":"fileindex_photo","keyword":"k","search_weight_list":[]}})");
  EXPECT_EQ(Sent(Alice(), "suggest", "{'terms':'ab'}"),
            R"({"command":"term_suggest","data":{"suggest_num":0,"terms":"ab","uid":60001}})");
  EXPECT_EQ(Sent(Carol(), "suggest", "{'terms':'','suggest_num':5,'indice':[],'suggester':['s']}"),
            R"({"command":"term_suggest","data":{"indice":[],"suggest_num":5,"suggester":["s"],)"
            R"("terms":"","uid":60003}})");
  EXPECT_EQ(Sent(Alice(), "list_avail_db", "{'x':1}"),
            R"({"command":"list_term_sugg_db","data":{}})");
  EXPECT_EQ(Sent(Bob(), "boost", "{'full_path':'/volume1/docs/any'}"),
            R"({"command":"record_spotlight_open","data":{"full_path":"/volume1/docs/any",)"
            R"("id":"fileindex_docs"}})");
}

TEST_F(Methods, IndicatePilesFiltersUp) {
  const char* params =
      "{'search_weight_list':[{'weight':2}],'criteria_list':[{'field':'f'}],'keyword':'k',"
      "'file_type':['a','b']}";
  EXPECT_EQ(Sent(Alice(), "indicate", params),
            R"({"command":"indicate","data":{"criteria_list":[{"field":"f"}],"indice":)"
            R"(["fileindex_deny","fileindex_docs","fileindex_homes","fileindex_photo"],)"
            R"("keyword":"k","queries":[{"name":"a","query":{"default_search_op":"AND","filters":[)"
            R"({"data":"alice","name":"permission"},{"data":"a","name":"file_type"}]}},)"
            R"({"name":"b","query":{"default_search_op":"AND","filters":[)"
            R"({"data":"alice","name":"permission"},{"data":"a","name":"file_type"},)"
            R"({"data":"alice","name":"permission"},{"data":"b","name":"file_type"}]}}],)"
            R"("search_weight_list":[{"weight":2}]}})");
  const std::string admin = Sent(Carol(), "indicate", params);
  EXPECT_EQ(admin.find("permission"), std::string::npos);
  EXPECT_THAT(admin, HasSubstr(R"(["fileindex_deny","fileindex_docs","fileindex_homes",)"
                               R"("fileindex_photo","fileindex_private"])"));
  const std::string none =
      Sent(Alice(), "indicate",
           "{'search_weight_list':[],'criteria_list':[],'keyword':'k','file_type':[]}");
  EXPECT_EQ(none.find("queries"), std::string::npos);
}

TEST_F(Methods, ReplyIsTheAnswer) {
  for (const Method& method : kMethods) {
    const bool drops = method.command == std::string("record_spotlight_open");
    const Answer good =
        AskWith(method, {FakeDaemon::Message("{\"data\":[{\"x\":1}],\"success\":true}")});
    EXPECT_TRUE(good.success);
    EXPECT_EQ(ToText(good.data), drops ? "null" : "[{'x':1}]") << method.name;
    EXPECT_EQ(good.log, "");

    const Answer failed = AskWith(
        method, {FakeDaemon::Message(
                    "{\"success\":false,\"error\":{\"code\":502,\"msg\":\"its reason\"}}")});
    EXPECT_EQ(failed.success, !method.judges) << method.name;
    EXPECT_EQ(failed.code, method.judges ? 502 : 0);
    EXPECT_EQ(ToText(failed.data), "null");
    EXPECT_THAT(failed.log, testing::EndsWith(method.judges ? "Error: its reason\n" : ""));
    EXPECT_EQ(failed.log.empty(), !method.judges);
  }
}

TEST_F(Methods, DaemonThatFails) {
  for (const Method& method : kMethods) {
    const auto line = [&](const std::string& text) {
      return ContainsRegex(std::string(method.place) + ":[0-9]+ \\([0-9]+, 60001\\) \\(" +
                           method.function + "\\) " + text);
    };
    // JSON of the wrong kind is nobody's business where nobody looks into the reply.
    for (const char* odd : {"[]", "7", "\"text\""}) {
      EXPECT_EQ(AskWith(method, {FakeDaemon::Message(odd)}).code, method.judges ? 121 : 0) << odd;
    }
    for (const char* bad : {"abc", "{} {}", ""}) {
      const Answer answer = AskWith(method, {FakeDaemon::Message(bad)});
      EXPECT_EQ(answer.code, 121) << method.name << bad;
      EXPECT_THAT(answer.log, HasSubstr(std::string("Malformed resp from daemon: ") + bad + "\n"));
      EXPECT_THAT(answer.log, line("Malformed resp from daemon: "));
    }
    for (const char* odd : {"{\"success\":false}", "{\"success\":\"no\",\"error\":5}",
                            "{\"success\":false,\"error\":{\"code\":\"x\"}}", "{\"data\":1}"}) {
      EXPECT_EQ(AskWith(method, {FakeDaemon::Message(odd)}).code, method.judges ? 121 : 0) << odd;
    }
    const Answer silent = AskWith(method, {FakeDaemon::HangUp()});
    EXPECT_EQ(silent.code, 121);
    EXPECT_THAT(silent.log, line("Recv from daemon fail"));
    const Answer cut = AskWith(method, {FakeDaemon::Bytes("{\"success\":true}")});
    EXPECT_EQ(cut.code, 121);

    const Answer missing = Ask(Alice(), method.name, FromText(method.params));
    EXPECT_EQ(missing.code, method.without_socket ? 0 : 605) << method.name;
    EXPECT_EQ(ToText(missing.data), method.without_socket ? method.without_socket : "null");
    MakeDeadSocket();
    const Answer dead = Ask(Alice(), method.name, FromText(method.params));
    EXPECT_EQ(dead.code, 605) << method.name;
    EXPECT_THAT(dead.log, line("Cannot connect to maruelastic daemon \\[err: "));
    unlink(kSocket);
  }
}

TEST_F(Methods, RequestThatCannotBeSent) {
  for (const Method& method : kMethods) {
    Json::Value params = FromText(method.params);
    if (method.name == std::string("list_avail_db")) continue;
    const char* longest = params.isMember("keyword") ? "keyword"
                          : params.isMember("terms") ? "terms"
                                                     : "full_path";
    params[longest] = params[longest].asString() + std::string(4 << 20, 'k');
    FakeDaemon daemon;
    daemon.RefuseNext();
    const Answer answer = Ask(Alice(), method.name, params);
    EXPECT_EQ(answer.code, 121) << method.name;
    EXPECT_THAT(answer.log, HasSubstr(std::string(method.function) + ") " + method.send_failure));
  }
}

TEST_F(Methods, HighlightNeedsARight) {
  struct Case {
    const char* path;
    int code;
  };
  const auto ask = [](const Login& login, const char* path) {
    Json::Value params = FromText(kMethods[0].params);
    params["full_path"] = path;
    return Ask(login, "highlight", params);
  };
  // Decided before the daemon is asked, which is not there at all.
  const Answer refused = ask(Alice(), "/volume1/photo/secret.txt");
  EXPECT_EQ(refused.code, 507);
  const std::string reason = "No file permission, path: /volume1/photo/secret.txt, user: alice";
  EXPECT_THAT(refused.log, HasSubstr("(ParseParams) Failed "
                                     "[!file_perm.CheckRead(full_path.Get())], reason: " +
                                     reason));
  for (const Case& one :
       {Case{"/volume1/private/p", 507}, Case{"/volume1/deny/d.txt", 507},
        Case{"/volume1/homes/bob/x.txt", 507}, Case{"/volume1/homes/alice/x.txt", 605},
        Case{"/volume1/photo/trip/a.jpg", 605}, Case{"/volume1/nowhere/x", 800},
        Case{"/volume1/", 800}, Case{"docs", 502}, Case{"/volume1", 502}, Case{"", 502},
        Case{"/volume1/photo/none", 502}, Case{"/volume1/photo/../private/p", 502}}) {
    EXPECT_EQ(ask(Alice(), one.path).code, one.code) << one.path;
  }
  EXPECT_EQ(ask(Carol(), "/volume1/photo/secret.txt").code, 605);
  EXPECT_EQ(ask(Bob(), "/volume1/photo/secret.txt").code, 605);
}

TEST_F(Methods, NothingToIndicate) {
  FakeDaemon daemon;
  for (const char* name : {"photo", "docs", "deny", "homes"}) {
    rename(("/var/lib/maruseeker/index/fileindex_" + std::string(name)).c_str(),
           ("/var/lib/maruseeker/index/" + std::string(name)).c_str());
  }
  const Answer answer = Ask(Alice(), "indicate", FromText(kMethods[3].params));
  for (const char* name : {"photo", "docs", "deny", "homes"}) {
    rename(("/var/lib/maruseeker/index/" + std::string(name)).c_str(),
           ("/var/lib/maruseeker/index/fileindex_" + std::string(name)).c_str());
  }
  EXPECT_EQ(ToText(answer.data), "{'a':0,'b':0}");
  EXPECT_TRUE(daemon.Requests().empty());
}

}  // namespace
