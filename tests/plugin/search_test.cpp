#include <gmock/gmock.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "plugin/plugin.h"
#include "support/fake_daemon.h"
#include "system/json.h"
#include "system/preferences.h"
#include "system/reason_to_end.h"

namespace {

using testing::ContainsRegex;
using testing::HasSubstr;

const std::string kGood = "{\"success\":true}";
constexpr const char* kQueryFile = "/tmp/tov_query_q.pid";

class Search : public PluginTest {
 protected:
  void SetUp() override {
    PluginTest::SetUp();
    if (IsSkipped()) return;
    unlink(kQueryFile);
    maru::Preferences(60001).Set("enable_history", false);
  }

  static Answer Find(const Login& login, const std::string& more = "") {
    return Ask(login, "search", FromText("{'search_weight_list':[]" + more + "}"));
  }

  static std::string Indice(const Login& login, const std::string& more = "") {
    FakeDaemon daemon;
    daemon.On("search", {FakeDaemon::Message(kGood)});
    EXPECT_TRUE(Find(login, more).success);
    if (daemon.Requests().empty()) return "not asked";
    return ToText(FromText(daemon.Requests()[0].text)["data"]["indice"]);
  }

  /// The code of the answer and the log when the daemon follows this script.
  static Answer FindWith(FakeDaemon::Script script) {
    FakeDaemon daemon;
    daemon.On("search", std::move(script));
    return Find(Alice());
  }
};

TEST_F(Search, RequestOfAUser) {
  FakeDaemon daemon;
  daemon.On("search", {FakeDaemon::Message(kGood)});
  EXPECT_TRUE(Find(Alice()).success);
  EXPECT_TRUE(
      Find(Alice(),
           ",'indice':['photo'],'from':-1,'size':20,'fields':['f'],'file_type':'document',"
           "'highlight':[{'field':'MARUMDTextContent'}],'keyword':' Ümlaut ','agent':'desktop',"
           "'criteria_list':[{'field':'x','value':'y'}],'query_id':'q','query_serial':3")
          .success);
  const auto requests = daemon.Requests();
  ASSERT_EQ(requests.size(), 2u);
  EXPECT_EQ(requests[0].peer.uid, 60001u);
  EXPECT_EQ(requests[0].text,
            R"({"command":"search","data":{"collector":{"agent":"others","has_criteria":false,)"
            R"("uid":60001},"default_search_op":"AND","fields":[],"filters":[{"data":"alice",)"
            R"("name":"permission"}],"from":0,"indice":["fileindex_deny","fileindex_docs",)"
            R"("fileindex_homes","fileindex_photo"],"lazy_field":["MARUMDTextContent"],)"
            R"("load_field":["MARUMDPath","MARUMDFSName","MARUMDExtension","MARUMDIsDir",)"
            R"("MARUMDFSSize"],"pre_query":{"criteria_list":[],"file_type":"","keyword":"",)"
            R"("search_weight_list":[]},"size":0}})");
  EXPECT_EQ(requests[1].text,
            R"({"command":"search","data":{"collector":{"agent":"desktop","has_criteria":true,)"
            R"("uid":60001},"default_search_op":"AND","fields":["f"],"filters":[{"data":"alice",)"
            R"("name":"permission"}],"from":-1,"highlight":[{"field":"MARUMDTextContent"}],)"
            R"("indice":["fileindex_photo"],"lazy_field":["MARUMDTextContent"],)"
            R"("load_field":["MARUMDPath","MARUMDFSName","MARUMDExtension","MARUMDIsDir",)"
            R"("MARUMDFSSize"],"pre_query":{"criteria_list":[{"field":"x","value":"y"}],)"
            R"("file_type":"document","keyword":" Ümlaut ","search_weight_list":[]},"size":20}})");
}

TEST_F(Search, SharesAdmitted) {
  EXPECT_EQ(Indice(Alice(), ",'indice':['private','nowhere','homes','docs','']"),
            "['fileindex_homes','fileindex_docs']");
  EXPECT_EQ(Indice(Bob()),
            "['fileindex_deny','fileindex_homes','fileindex_photo','fileindex_private']");
  EXPECT_EQ(Indice(Carol(), ",'indice':['private','nowhere','hidden']"),
            "['fileindex_private','fileindex_hidden']");
  EXPECT_EQ(Indice(Alice(), ",'indice':['private'],'query_id':'q'"), "not asked");
  FakeDaemon daemon;
  daemon.On("search", {FakeDaemon::Message(kGood)});
  EXPECT_EQ(ToText(Find(Alice(), ",'indice':['private']").data), "{'hits':[],'total':0}");
  EXPECT_TRUE(Find(Carol()).success);
  EXPECT_EQ(daemon.Requests()[0].text.find("filters"), std::string::npos);
  EXPECT_EQ(daemon.Requests()[0].peer.uid, 0u);
}

TEST_F(Search, NewestQueryWins) {
  const pid_t older = fork();
  if (older == 0) {
    EXPECT_EQ(setuid(60001), 0);
    pause();
    _exit(0);
  }
  const std::string file = "{\"mine\":1,\"pid\":" + std::to_string(older) + ",\"query_serial\":5}";
  WriteFile(kQueryFile, file, 0600, 60001);
  const std::string serial = ",'query_id':'q','query_serial':";
  const auto content = [] {
    std::ifstream stream(kQueryFile);
    return std::string(std::istreambuf_iterator(stream), {});
  };
  const Answer outdated = Find(Alice(), serial + "5");
  EXPECT_EQ(outdated.code, 1600);
  EXPECT_THAT(outdated.log, ContainsRegex("^[^\n]*Error: Outdated query[^\n]*\n$"));
  EXPECT_EQ(content(), file);
  EXPECT_EQ(Find(Alice(), serial + "-1").code, 1600);
  EXPECT_EQ(kill(older, 0), 0);

  // Without a daemon the answer is empty, and the file stays.
  EXPECT_EQ(ToText(Find(Alice(), serial + "6").data), "{'hits':[],'total':0}");
  int status = 0;
  EXPECT_EQ(waitpid(older, &status, 0), older);
  EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL);
  Json::Value info;
  EXPECT_TRUE(maru::json::FromFile(kQueryFile, info));
  EXPECT_EQ(info["mine"], 1);
  EXPECT_EQ(info["query_serial"], 6);
  EXPECT_NE(info["pid"], older);

  // The process named has ended since; with an answer the file goes.
  FakeDaemon daemon;
  daemon.On("search", {FakeDaemon::Message(kGood)});
  EXPECT_TRUE(Find(Alice(), serial + "7").success);
  EXPECT_FALSE(std::filesystem::exists(kQueryFile));
}

TEST_F(Search, QueryKilledWhileItWaits) {
  FakeDaemon daemon;
  daemon.On("search", {FakeDaemon::Message("{\"total\":1}"), FakeDaemon::Stall()});
  daemon.On("search", {FakeDaemon::Message(kGood)});
  const pid_t older = fork();
  if (older == 0) {
    Enter(Alice(), "search", FromText("{'query_id':'q','query_serial':1}"));
    _exit(0);
  }
  ASSERT_TRUE(daemon.WaitForRequests(1));
  EXPECT_TRUE(Find(Alice(), ",'query_id':'q','query_serial':2").success);
  int status = 0;
  waitpid(older, &status, 0);
  EXPECT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL);
}

TEST_F(Search, EndsTheProcessThatAFileStillNames) {
  const auto reason_after = [](const char* query) {
    return InChild([&] {
             Enter(Alice(), "search", FromText(query));
             return Json::Value(maru::ReasonToEnd::Exists());
           })
        .value.asBool();
  };
  EXPECT_TRUE(reason_after("{'query_id':'q','query_serial':1}")) << "without a daemon it stays";
  EXPECT_FALSE(reason_after("{}"));
  FakeDaemon daemon;
  daemon.On("search", {FakeDaemon::Message(kGood)});
  EXPECT_FALSE(reason_after("{'query_id':'q','query_serial':2}"));
}

TEST_F(Search, QueryFilesOfNoUse) {
  struct Case {
    const char* content;
    int code;
  };
  for (const Case& one :
       {Case{"{\"pid\":0,\"query_serial\":1}", 1600}, Case{"{\"pid\":-1,\"query_serial\":1}", 1600},
        Case{"{\"query_serial\":1}", 1600}, Case{"{\"pid\":\"x\"}", 1600},
        Case{"{\"pid\":3000000000}", 1600}, Case{"[]", 0}, Case{"7", 0}, Case{"", 0},
        Case{"{\"pid\":", 0}}) {
    WriteFile(kQueryFile, one.content, 0600, 60001);
    EXPECT_EQ(Find(Alice(), ",'query_id':'q','query_serial':9").code, one.code) << one.content;
    unlink(kQueryFile);
  }
  const Answer slash = Find(Alice(), ",'query_id':'../q'");
  EXPECT_EQ(slash.code, 120);
  EXPECT_THAT(slash.log,
              HasSubstr("(Search) Failed [string::npos != query_id_.find(\"/\")], reason: "));
  const Answer unwritable = Find(Alice(), ",'query_id':'" + std::string(300, 'q') + "'");
  EXPECT_TRUE(unwritable.success);
  EXPECT_THAT(unwritable.log, ContainsRegex("\\(Search\\) Failed \\[!query_info\\.toFile"
                                            "\\(query_info_file\\)\\] \\[err: "));
}

TEST_F(Search, StreamOfHits) {
  const Answer answer =
      FindWith({FakeDaemon::Message("{\"total\":3}"), FakeDaemon::Bytes("{\"a\":1}\n{\"b\""),
                FakeDaemon::Bytes(":2}\n"), FakeDaemon::Message("{\"total\":9}"),
                FakeDaemon::Message(kGood)});
  ASSERT_TRUE(answer.success);
  EXPECT_EQ(answer.data["total"], 9);
  ASSERT_EQ(answer.data["hits"].size(), 2u);
  EXPECT_EQ(answer.data["hits"][0]["a"], 1);
  EXPECT_EQ(answer.data["hits"][1]["b"], 2);

  const Answer bare = FindWith({FakeDaemon::Message(kGood)});
  EXPECT_EQ(ToText(bare.data), "{'hits':[]}");

  const Answer failed =
      FindWith({FakeDaemon::Message("{\"x\":1}"),
                FakeDaemon::Message("{\"success\":false,\"error\":{\"code\":502,\"msg\":\"m\"}}")});
  EXPECT_TRUE(failed.success);
  EXPECT_EQ(failed.data["hits"].size(), 1u);
  EXPECT_THAT(failed.log, HasSubstr("(Search) error: {\"code\":502,\"msg\":\"m\"}"));
  EXPECT_THAT(FindWith({FakeDaemon::Message("{\"success\":false}")}).log,
              HasSubstr("error: \"Unknown error\""));
}

TEST_F(Search, DaemonThatFails) {
  const std::string line = "(Search) Failed [";
  for (const char* bad : {"abc", "[]", "7", "{\"total\":\"3\"}", "{\"total\":3000000000}",
                          "{\"success\":true}x", ""}) {
    const Answer answer = FindWith({FakeDaemon::Message(bad)});
    EXPECT_EQ(answer.code, 121) << bad;
    EXPECT_THAT(answer.log, HasSubstr(line + "!js_resp.fromString(str_resp)], reason: \n"));
  }
  for (const FakeDaemon::Step& step :
       {FakeDaemon::HangUp(), FakeDaemon::Bytes("{\"success\":tr")}) {
    const Answer answer = FindWith({FakeDaemon::Message("{\"total\":1}"), step});
    EXPECT_EQ(answer.code, 121);
    EXPECT_THAT(answer.log, HasSubstr(line + "!conn.Recv(str_resp)], reason: "));
  }
  {
    FakeDaemon daemon;
    daemon.RefuseNext();
    const Answer unsent = Find(Alice(), ",'keyword':'" + std::string(4 << 20, 'k') + "'");
    EXPECT_EQ(unsent.code, 121);
    EXPECT_THAT(unsent.log, HasSubstr(line + "!conn.Send(js_req_to_daemon.toString())], reason: "));
  }
  EXPECT_EQ(ToText(Find(Alice()).data), "{'hits':[],'total':0}");
  MakeDeadSocket();
  const Answer dead = Find(Alice());
  EXPECT_EQ(dead.code, 605);
  EXPECT_THAT(dead.log, HasSubstr(line + "!conn.Connect()], reason:  [err: Connection refused]"));
  unlink(kSocket);
}

TEST_F(Search, WhatHitsGain) {
  mkdir("/mnt/photo/mounted", 0755);
  ASSERT_EQ(mount("/mnt/private", "/mnt/photo/mounted", nullptr, MS_BIND, nullptr), 0);
  ASSERT_EQ(mount("disk", "/mnt/our docs", "tmpfs", 0, "mode=755"), 0);
  WriteFile("/volume1/photo/dropbox.txt", "", 0733);
  struct Case {
    const char* hit;
    const char* gained;
  };
  const Case cases[] = {
      {"{'MARUMDPath':'/volume1/photo/trip/a.jpg','MARUMDOwnerUserID':'60002'}",
       "{'MARUMDOwnerUserName':'bob','MARUMDSharePath':'/photo/trip/a.jpg','additional':"
       "{'is_mount_point':false},'readable':true}"},
      {"{'MARUMDPath':'/volume1/photo/secret.txt','MARUMDOwnerUserID':'60001'}",
       "{'MARUMDOwnerUserName':'alice','MARUMDSharePath':'/photo/secret.txt','additional':"
       "{'is_mount_point':false},'readable':false}"},
      {"{'MARUMDPath':'/volume1/homes/alice/x.txt','MARUMDOwnerUserID':''}",
       // The homes admit bob only.
       "{'MARUMDSharePath':'/home/x.txt','additional':{'is_mount_point':false},'readable':false}"},
      {"{'MARUMDPath':'/volume1/homes/bob/x.txt','MARUMDOwnerUserID':'60002xyz'}",
       "{'MARUMDOwnerUserName':'bob','MARUMDSharePath':'/homes/bob/x.txt','additional':"
       "{'is_mount_point':false},'readable':false}"},
      {"{'MARUMDPath':'/volume1/photo/mounted','MARUMDOwnerUserID':'54321','additional':{'k':1}}",
       "{'MARUMDOwnerUserName':'','MARUMDSharePath':'/photo/mounted','additional':"
       "{'is_mount_point':true,'k':1},'readable':true}"},
      {"{'MARUMDPath':'/volume1/photo','MARUMDOwnerUserID':'54321'}",
       "{'MARUMDOwnerUserName':'','MARUMDSharePath':'/photo','additional':"
       "{'is_mount_point':false},'readable':true}"},
      {"{'MARUMDPath':'/volume1/docs'}",
       "{'MARUMDSharePath':'/docs','additional':{'is_mount_point':true},'readable':true}"},
      {"{'MARUMDPath':'/volume1/photo/dropbox.txt'}",
       "{'MARUMDSharePath':'/photo/dropbox.txt','additional':{'is_mount_point':false},"
       "'readable':false}"},
      {"{'MARUMDPath':'/volume1/nowhere'}",
       "{'MARUMDSharePath':'','additional':{'is_mount_point':false},'readable':false}"},
      {"{'MARUMDPath':'/elsewhere/a','MARUMDOwnerUserID':'letters'}",
       "{'MARUMDOwnerUserName':'','MARUMDSharePath':'','additional':{'is_mount_point':false},"
       "'readable':false}"},
      {"{'MARUMDPath':[],'MARUMDOwnerUserID':'99999999999999999999','additional':7}",
       "{'MARUMDOwnerUserName':'','MARUMDSharePath':'','additional':{'is_mount_point':false},"
       "'readable':false}"},
      {"{}", "{'MARUMDSharePath':'','additional':{'is_mount_point':false},'readable':false}"}};
  FakeDaemon::Script script;
  for (const Case& one : cases) {
    script.push_back(FakeDaemon::Message(maru::json::ToString(FromText(one.hit))));
  }
  script.push_back(FakeDaemon::Message(kGood));
  const Answer answer = FindWith(std::move(script));
  umount("/mnt/photo/mounted");
  umount("/mnt/our docs");
  ASSERT_EQ(answer.data["hits"].size(), std::size(cases));
  for (unsigned i = 0; i < std::size(cases); ++i) {
    Json::Value expected = FromText(cases[i].hit);
    for (const auto& gained = FromText(cases[i].gained);
         const auto& key : gained.getMemberNames()) {
      expected[key] = gained[key];
    }
    EXPECT_EQ(ToText(answer.data["hits"][i]), ToText(expected));
  }
  EXPECT_THAT(answer.log, HasSubstr("(GetSharePath) MARUShareNamePathGet failed, "
                                    "vol_path=/elsewhere/a"));
}

}  // namespace
