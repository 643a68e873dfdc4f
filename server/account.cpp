#include "server/account.h"

#include <errno.h>
#include <pwd.h>
#include <security/pam_appl.h>
#include <shadow.h>
#include <sodium.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <vector>

#include "system/accounts.h"
#include "system/log.h"

namespace maru::server {
namespace {

constexpr const char* kPamService = "maruseeker";
constexpr long kSecondsPerDay = 24 * 3600;
constexpr std::size_t kShadowRoom = 16 << 10;

struct ShadowState {
  bool expired = false;
  std::string stamp;
};

ShadowState ReadShadow(const char* name) {
  spwd entry{};
  spwd* found = nullptr;
  std::vector<char> room(kShadowRoom);
  getspnam_r(name, &entry, room.data(), room.size(), &found);
  errno = 0;
  if (!found) return {};
  ShadowState state;
  state.expired = found->sp_expire > 0 && time(nullptr) / kSecondsPerDay >= found->sp_expire;
  const char* password = found->sp_pwdp ? found->sp_pwdp : "";
  unsigned char digest[crypto_generichash_BYTES_MIN];
  crypto_generichash(digest, sizeof(digest), reinterpret_cast<const unsigned char*>(password),
                     strlen(password), nullptr, 0);
  char text[2 * sizeof(digest) + 1];
  state.stamp = sodium_bin2hex(text, sizeof(text), digest, sizeof(digest));
  sodium_memzero(room.data(), room.size());
  return state;
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
    errno = 0;
    return result == PAM_SUCCESS;
  }

  pam_conv conversation_;
  pam_handle_t* handle_ = nullptr;
  int result_;
};

}  // namespace

std::optional<Account> FindAccount(const std::string& name) {
  const std::optional<maru::Account> account = AccountByName(name);
  if (!account) return std::nullopt;
  ShadowState shadow = ReadShadow(account->name.c_str());
  if (shadow.expired) return std::nullopt;
  return Account{account->name, account->uid, std::move(shadow.stamp)};
}

bool IsAdministrator(const std::string& name) {
  const std::optional<maru::Account> account = AccountByName(name);
  return account && maru::IsAdministrator(*account);
}

bool IsAdmitted(const std::string& name) {
  return PamTransaction(name, "").Admit();
}

std::optional<Account> SignIn(const std::string& user, const std::string& password,
                              const std::string& source) {
  PamTransaction pam(user, password);
  if (!pam.Authenticate(source) || !pam.Admit()) return std::nullopt;
  return FindAccount(pam.User());
}

}  // namespace maru::server
