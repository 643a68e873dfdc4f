#include "server/host/user.h"

#include <security/pam_appl.h>
#include <shadow.h>
#include <sodium.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <vector>

#include "system/accounts.h"

namespace maru::server {
namespace {

constexpr const char* kPamService = "maruseeker";
constexpr long kSecondsPerDay = 24 * 3600;
constexpr std::size_t kShadowRoom = 16 << 10;

/// Empty where the password entry cannot be read; nothing when the account has expired.
std::optional<std::string> StampOf(const std::string& name) {
  spwd entry{};
  spwd* found = nullptr;
  std::vector<char> room(kShadowRoom);
  getspnam_r(name.c_str(), &entry, room.data(), room.size(), &found);
  if (!found) return "";
  const bool expired = found->sp_expire > 0 && time(nullptr) / kSecondsPerDay >= found->sp_expire;
  const char* password = found->sp_pwdp ? found->sp_pwdp : "";
  unsigned char digest[crypto_generichash_BYTES_MIN];
  crypto_generichash(digest, sizeof(digest), reinterpret_cast<const unsigned char*>(password),
                     strlen(password), nullptr, 0);
  char text[2 * sizeof(digest) + 1];
  sodium_bin2hex(text, sizeof(text), digest, sizeof(digest));
  sodium_memzero(room.data(), room.size());
  return expired ? std::nullopt : std::optional<std::string>(text);
}

/// Answers PAM's questions: the password wherever it asks without echo, nothing else.
int Converse(int count, const pam_message** questions, pam_response** answers, void* data) {
  if (count <= 0 || count > PAM_MAX_NUM_MSG) return PAM_CONV_ERR;
  auto* replies = static_cast<pam_response*>(calloc(static_cast<size_t>(count), sizeof(**answers)));
  if (!replies) return PAM_BUF_ERR;
  const auto* password = static_cast<const std::string*>(data);
  for (int i = 0; i < count; ++i)
    if (questions[i]->msg_style == PAM_PROMPT_ECHO_OFF) replies[i].resp = strdup(password->c_str());
  *answers = replies;
  return PAM_SUCCESS;
}

class PamTransaction {
 public:
  PamTransaction(const std::string& user, const std::string& password)
      : conversation_{Converse, const_cast<std::string*>(&password)},
        result_(pam_start(kPamService, user.c_str(), &conversation_, &handle_)) {}
  PamTransaction(const PamTransaction&) = delete;
  PamTransaction& operator=(const PamTransaction&) = delete;
  ~PamTransaction() {
    if (handle_) pam_end(handle_, result_);
  }

  bool Authenticate(const std::string& source) {
    return Step(result_) && Step(pam_set_item(handle_, PAM_RHOST, source.c_str())) &&
           Step(pam_set_item(handle_, PAM_TTY, "maruweb")) &&
           Step(pam_authenticate(handle_, PAM_SILENT | PAM_DISALLOW_NULL_AUTHTOK));
  }

  bool Admit() {
    return Step(result_) && Step(pam_acct_mgmt(handle_, PAM_SILENT | PAM_DISALLOW_NULL_AUTHTOK));
  }

  /// The user's name as PAM's modules left it.
  std::string User() const {
    const void* user = nullptr;
    pam_get_item(handle_, PAM_USER, &user);
    return user ? static_cast<const char*>(user) : "";
  }

 private:
  bool Step(int result) {
    result_ = result;
    return result == PAM_SUCCESS;
  }

  pam_conv conversation_;
  pam_handle_t* handle_ = nullptr;
  int result_;
};

}  // namespace

Json::Value Description(const User& user) {
  Json::Value data;
  data["user"] = user.name;
  data["uid"] = user.uid;
  data["is_admin"] = user.is_admin;
  return data;
}

std::optional<User> FindUser(const std::string& name) {
  const std::optional<Account> account = AccountByName(name);
  if (!account) return std::nullopt;
  const auto stamp = StampOf(account->name);
  if (!stamp) return std::nullopt;
  return User{account->name, account->uid, *stamp, IsAdministrator(*account)};
}

bool IsAdmitted(const std::string& name) {
  return PamTransaction(name, "").Admit();
}

std::optional<User> SignIn(const std::string& name, const std::string& password,
                           const std::string& source) {
  PamTransaction pam(name, password);
  if (!pam.Authenticate(source) || !pam.Admit()) return std::nullopt;
  return FindUser(pam.User());
}

}  // namespace maru::server
