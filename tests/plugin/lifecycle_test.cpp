#include <gmock/gmock.h>
#include <pthread.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include "common/sdk/credentials.h"
#include "plugin/plugin.h"
#include "webapi/seeker_api.h"

namespace {

using maruseeker::Error;
using maruseeker::ErrorCode;
using maruseeker::sdk::SDKCredentials;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

/// A method whose steps a test fills in. Each step leaves its mark in the log.
class ProbeAPI : public maruseeker::webapi::SeekerAPI {
 public:
  using SeekerAPI::SeekerAPI;
  void ParseParams() override { Step(parse_, "parsed"); }
  void Execute() override { Step(execute_, "executed"); }
  void FormOutput() override {
    Step(form_, "formed");
    output_ = "body of " + session_id_;
    set_success_ = !answers_itself_;
  }
  void PostActions() override { Step(post_, "followed up"); }

  static void Step(const std::function<void()>& step, const char* mark) {
    step();
    MARU_LOG("%s as %u", mark, geteuid());
  }
  static inline std::function<void()> parse_, execute_, form_, post_;
  static inline bool answers_itself_;
};

class Lifecycle : public PluginTest {
 protected:
  void SetUp() override {
    PluginTest::SetUp();
    ProbeAPI::parse_ = ProbeAPI::execute_ = ProbeAPI::form_ = ProbeAPI::post_ = [] {};
    ProbeAPI::answers_itself_ = false;
  }

  static Ran Run(const Login& login) {
    return InChild([&] {
      MARU::APIRequest request(login, Json::Value());
      MARU::APIResponse response;
      maruseeker::webapi::SeekerAPIRun<ProbeAPI>(&request, &response);
      return Json::Value(!response.IsSet() ? std::string("no answer")
                         : response.IsSuccess()
                             ? ToText(response.Data())
                             : std::to_string(response.ErrorCode()) + ToText(response.Data()));
    });
  }
};

TEST_F(Lifecycle, StepsInOrderAsTheLoginUser) {
  const Ran alice = Run(Alice());
  EXPECT_EQ(alice.value, "'body of session-of-alice'");
  EXPECT_THAT(alice.log, ContainsRegex("parsed as 60001\n.*executed as 60001\n.*formed as 60001\n"
                                       ".*followed up as 60001\n"));
  EXPECT_THAT(Run(Carol()).log, HasSubstr("executed as 0\n"));
}

TEST_F(Lifecycle, FailuresBecomeAnswers) {
  ProbeAPI::execute_ = [] { throw Error(maruseeker::kErrorUser, "no such user"); };
  const Ran error = Run(Alice());
  EXPECT_EQ(error.value, "801null");
  EXPECT_THAT(error.log, ContainsRegex("seeker_api\\.h:55 \\([0-9]+, [0-9]+\\) \\(SeekerAPIRun\\) "
                                       "Error: no such user\n"));
  EXPECT_THAT(error.log, Not(HasSubstr("followed up")));

  ProbeAPI::execute_ = [] { throw Error(static_cast<ErrorCode>(-7)); };
  const Ran empty = Run(Alice());
  EXPECT_EQ(empty.value, "-7null");
  EXPECT_THAT(empty.log, HasSubstr("(SeekerAPIRun) Error: \n"));

  ProbeAPI::execute_ = [] { throw std::out_of_range("far"); };
  const Ran other = Run(Alice());
  EXPECT_EQ(other.value, "117null");
  EXPECT_THAT(other.log, HasSubstr("(SeekerAPIRun) Unknown error: far\n"));
  EXPECT_THAT(other.log, HasSubstr("seeker_api.h:58 "));

  ProbeAPI::execute_ = [] { throw 5; };
  const Ran unknown = Run(Alice());
  EXPECT_EQ(unknown.value, "117null");
  EXPECT_THAT(unknown.log, ContainsRegex("seeker_api\\.h:61 .*\\(SeekerAPIRun\\) Unknown error\n"));

  Login nobody = Alice();
  nobody.user_name = "nobody of this name";
  const Ran refused = Run(nobody);
  EXPECT_EQ(refused.value, "503null");
  EXPECT_THAT(refused.log, Not(HasSubstr("parsed")));
}

TEST_F(Lifecycle, WorkAfterTheAnswer) {
  ProbeAPI::post_ = [] { throw Error(maruseeker::kErrorShare, "photo"); };
  const Ran error = Run(Alice());
  EXPECT_EQ(error.value, "'body of session-of-alice'");
  EXPECT_THAT(error.log, ContainsRegex("task\\.h:33 \\([0-9]+, 60001\\) \\(DoTask\\) "
                                       "Failed to execute, 800 photo\n"));
  ProbeAPI::post_ = [] { throw std::runtime_error("why"); };
  EXPECT_THAT(Run(Alice()).log, ContainsRegex("task\\.h:35 .*Failed to execute, why\n"));
  ProbeAPI::post_ = [] { throw 5; };
  EXPECT_THAT(Run(Alice()).log, ContainsRegex("task\\.h:37 .*Failed to execute\n"));

  ProbeAPI::post_ = [] {};
  ProbeAPI::answers_itself_ = true;
  const Ran own = Run(Alice());
  EXPECT_EQ(own.value, "no answer");
  EXPECT_THAT(own.log, HasSubstr("followed up"));

  ProbeAPI::answers_itself_ = false;
  ProbeAPI::execute_ = [] {
    const rlimit none = {0, 0};
    setrlimit(RLIMIT_NPROC, &none);
  };
  const Ran alone = Run(Alice());
  EXPECT_EQ(alone.value, "'body of session-of-alice'");
  EXPECT_THAT(alone.log, ContainsRegex("task\\.h:43 .*\\(DoTask\\) Failed to fork \\[err: "));
}

TEST_F(Lifecycle, CancelledThreadIsNoFailure) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizers take the reference that stands for the unwinding for a null one";
#endif
  ProbeAPI::execute_ = [] {
    pthread_cancel(pthread_self());
    pthread_testcancel();
  };
  const Ran ran = InChild([] {
    static MARU::APIResponse response;
    pthread_t thread;
    pthread_create(
        &thread, nullptr,
        [](void*) -> void* {
          MARU::APIRequest request({0, "root", "", true}, Json::Value());
          maruseeker::webapi::SeekerAPIRun<ProbeAPI>(&request, &response);
          return nullptr;
        },
        nullptr);
    void* end = nullptr;
    pthread_join(thread, &end);
    return Json::Value(end == PTHREAD_CANCELED && !response.IsSet());
  });
  EXPECT_TRUE(ran.value.asBool());
}

/// What `work` throws.
Json::Value Thrown(const std::function<void()>& work) {
  try {
    work();
  } catch (const Error& error) {
    return std::to_string(error.Code()) + " " + error.Reason();
  } catch (int number) {
    return number;
  }
  return "nothing";
}

TEST_F(Lifecycle, CredentialsComeBack) {
  const Ran ran = InChild([] {
    Json::Value ids;
    const auto note = [&ids] {
      ids.append(std::to_string(geteuid()) + ":" + std::to_string(getegid()) + ":" +
                 std::to_string(getgroups(0, nullptr)));
    };
    {
      SDKCredentials back_to_root;
      back_to_root.AsUser("alice");
      note();
      {
        // A scope with a name comes back to that name, not to the one before.
        SDKCredentials bob("bob");
        note();
      }
      note();
      back_to_root.AsUser("carol");
      note();
    }
    note();
    return ids;
  });
  EXPECT_EQ(ToText(ran.value), "['60001:60001:2','60002:60002:2','60002:60002:2','0:0:1','0:0:1']");
}

TEST_F(Lifecycle, CredentialsThatFail) {
  const Ran unknown = InChild([] {
    EXPECT_EQ(setresuid(54321, 54321, 0), 0);
    return Thrown([] { SDKCredentials who; });
  });
  EXPECT_THAT(unknown.value.asString(), ContainsRegex("^503 MARUUserGetByUID failed, err=[0-9]+$"));
  EXPECT_THAT(unknown.log,
              ContainsRegex("credentials\\.cpp:22 \\([0-9]+, 54321\\) \\(SDKCredentials\\) Failed "
                            "\\[0 > MARUUserGetByUID\\(euid_, &user_info\\) \\|\\| !user_info\\], "
                            "reason: MARUUserGetByUID failed, err=[0-9]+"));

  const Ran missing = InChild([] { return Thrown([] { SDKCredentials who("no such user"); }); });
  EXPECT_EQ(missing.value, "503 ");
  EXPECT_THAT(missing.log, ContainsRegex("credentials\\.cpp:53 .*\\(AsUser\\) Failed "
                                         "\\[!ResetCredentialsByName\\(target_username\\)\\], "
                                         "reason: "));

  for (const bool in_flight : {false, true}) {
    const Ran stuck = InChild([&] {
      return Thrown([&] {
        SDKCredentials root;
        root.AsUser("alice");
        EXPECT_EQ(setresuid(60001, 60001, 60001), 0);
        if (in_flight) throw 7;
      });
    });
    EXPECT_EQ(ToText(stuck.value), in_flight ? "7" : "'503 '");
    EXPECT_THAT(stuck.log, ContainsRegex("credentials\\.cpp:39 .*\\(~SDKCredentials\\) Failed "
                                         "\\[!ResetCredentialsByName\\(username_\\)\\], reason: "));
  }
}

TEST(Errors, ReasonIsAllThatShows) {
  const Error bare(maruseeker::kErrorDaemonExchange);
  EXPECT_STREQ(bare.what(), "");
  EXPECT_STREQ(bare.std::runtime_error::what(), "MaruSeeker error, code=121");
  const Error full(maruseeker::kErrorPlatform, "x");
  EXPECT_STREQ(full.what(), "x");
  EXPECT_STREQ(full.std::runtime_error::what(), "MaruSeeker error, code=502, reason=[x]");
}

}  // namespace
