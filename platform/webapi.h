#pragma once

#include <json/value.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>
#include <utility>

/// The web-API framework: what a plug-in sees of one request, and how it answers.
namespace MARU {

/// How a JSON member is asked for with `APIParameterFactoryBasicImpl`: 0 required, 1 optional.
enum PARAM_NECESSITY { PARAM_REQUIRED = 0, PARAM_OPTIONAL = 1 };

/// What a typed reader found: absent, present and good, or present and of another type (or refused
/// by the validator).
template <class T>
class APIParameter {
 public:
  APIParameter(bool set, bool invalid, T value)
      : set_(set), invalid_(invalid), value_(std::move(value)) {}

  /// Required and absent, or present and bad.
  bool IsInvalid() const { return invalid_; }
  /// Present in the request, good or bad.
  bool IsSet() const { return set_; }
  /// Not supplied.
  bool IsReset() const { return !set_; }
  /// The value; an empty one (0, "", null) when absent or bad.
  T Get() const { return value_; }
  /// The value, or `fallback` when absent or bad.
  T Get(const T& fallback) const { return set_ && !invalid_ ? value_ : fallback; }

 private:
  bool set_;
  bool invalid_;
  T value_;
};

/// Reads one member of a JSON object as T: std::string, int (32 bits), double or bool. Never
/// throws. A member of another type, null included, is set and invalid; an absent one is invalid
/// only when required.
template <class T>
struct APIParameterFactoryBasicImpl {
  using Validator = std::function<bool(const T&)>;
  static APIParameter<T> FromJson(const Json::Value& object, const std::string& key,
                                  PARAM_NECESSITY necessity, const Validator& validator);
};

/// One request, already parsed and authenticated by the web server. Immutable; the plug-in borrows
/// it.
class APIRequest {
 public:
  enum PARAM_NECESSITY { REQUIRED = 0, OPTIONAL = 1 };
  template <class T>
  using Validator = std::function<bool(const T&)>;

  struct Login {
    uid_t uid = 0;
    std::string user_name;
    std::string session_id;
    bool is_admin = false;
  };

  /// `params` is the object of request parameters; anything but an object counts as empty.
  APIRequest(Login login, Json::Value params);

  uid_t GetLoginUID() const { return login_.uid; }
  const std::string& GetLoginUserName() const { return login_.user_name; }
  const std::string& GetSessionID() const { return login_.session_id; }
  bool IsAdmin() const { return login_.is_admin; }

  APIParameter<std::string> GetAndCheckString(const std::string& name, PARAM_NECESSITY necessity,
                                              const Validator<std::string>& validator) const;
  APIParameter<int> GetAndCheckInt(const std::string& name, PARAM_NECESSITY necessity,
                                   const Validator<int>& validator) const;
  APIParameter<Json::Value> GetAndCheckObject(const std::string& name, PARAM_NECESSITY necessity,
                                              const Validator<Json::Value>& validator) const;
  APIParameter<Json::Value> GetAndCheckArray(const std::string& name, PARAM_NECESSITY necessity,
                                             const Validator<Json::Value>& validator) const;
  /// An array whose elements the caller checks one by one. Accepts JSON arrays only.
  APIParameter<Json::Value> GetAndCheckUnitArray(const std::string& name, PARAM_NECESSITY necessity,
                                                 const Validator<Json::Value>& validator) const;

 private:
  Login login_;
  Json::Value params_;
};

/// The answer. The last call of SetSuccess or SetError wins, unless a success is taken at once.
class APIResponse {
 public:
  using Taker = std::function<void(const Json::Value& data)>;

  APIResponse() = default;
  /// `take_success` is called within the first SetSuccess, so that the client need not wait for
  /// what the method does after it. That success is the answer: its data are not kept here, and an
  /// error set later is only seen in this object.
  explicit APIResponse(Taker take_success) : take_success_(std::move(take_success)) {}

  void SetSuccess(const Json::Value& data);
  void SetError(int code, const Json::Value& data);

  /// False until one of the setters was called.
  bool IsSet() const { return set_; }
  bool IsSuccess() const { return success_; }
  int ErrorCode() const { return error_code_; }
  const Json::Value& Data() const { return data_; }

 private:
  bool set_ = false;
  bool success_ = false;
  int error_code_ = 0;
  Json::Value data_;
  Taker take_success_;
  bool taken_ = false;
};

using APIEntry = void (*)(APIRequest*, APIResponse*);
using APICheck = bool (*)(APIRequest*, APIResponse*);

/// Rows of a plug-in's two tables; both end at the first row whose `api` is null.
struct APIRow {
  const char* api;
  std::uintptr_t version;
  const char* method;
  APIEntry entry;
};

struct APICheckRow {
  const char* api;
  std::uintptr_t version;
  const char* method;
  APICheck check;
  std::uintptr_t reserved[2];
};

}  // namespace MARU
