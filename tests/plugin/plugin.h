#pragma once

#include <gtest/gtest.h>
#include <json/value.h>

#include <functional>
#include <string>

#include "platform/webapi.h"

/// Driving maruseeker.so as the web server does: a child process for each request, which acts as
/// the user and whose log is read from its standard error.

using Login = MARU::APIRequest::Login;

Login Alice();
Login Bob();
/// A member of the administrators' group.
Login Carol();

/// What came of a child process and of everything it forked.
struct Ran {
  Json::Value value;
  /// Every line that was logged.
  std::string log;
  /// As waitpid tells it; 0: ended well.
  int status = -1;
};

/// Starts `work` in a child process with a log of its own, and waits for it and for its children.
Ran InChild(const std::function<Json::Value()>& work);

/// How the plug-in answered.
struct Answer {
  /// Whether the check function let the request pass.
  bool accepted = false;
  bool success = false;
  int code = -1;
  Json::Value data;
  std::string log;
};

MARU::APIRow* Rows();
MARU::APICheckRow* CheckRows();

/// The check function of a method, and its entry function after that when it accepts.
Answer Ask(const Login& login, const std::string& method, const Json::Value& params);
/// The entry function alone, in this process.
Json::Value Enter(const Login& login, const std::string& method, const Json::Value& params);
/// The check function alone, in this process: "accepted", or "NAME REASON" of the refusal.
std::string Check(const std::string& method, const Json::Value& params);

/// The same as JSON text, with ' for ".
Json::Value FromText(std::string text);
std::string ToText(const Json::Value& value);

/// A world for each test process: in a mount namespace of its own, with empty /tmp and /run, a
/// state folder, and under /mnt, mounted under /volume1 by the web server's own hand, the shares
/// photo, docs ("/mnt/our docs"; only alice may enter), private (only bob may), deny (nobody may
/// read), unlisted (nobody may list), hidden (hides what cannot be read, has a recycle bin) and
/// homes (by its own list for bob only); all but unlisted and hidden are indexed. Files:
/// photo/trip/a.jpg (readable for all), photo/secret.txt (bob only), deny/d.txt, unlisted/u.txt,
/// homes/alice/x.txt, homes/bob/x.txt.
class PluginTest : public testing::Test {
 protected:
  /// Skips where the accounts are missing.
  void SetUp() override;
};

inline constexpr const char* kSocket = "/var/run/maruelasticd.sock";
/// A socket file behind which nobody listens.
void MakeDeadSocket();
void WriteFile(const std::string& path, const std::string& text, unsigned mode = 0644,
               unsigned owner = 0);
