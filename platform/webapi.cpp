#include "platform/webapi.h"

namespace MARU {
namespace {

template <class T>
bool Read(const Json::Value& value, T& result) {
  if (!value.is<T>()) return false;
  result = value.as<T>();
  return true;
}

/// An object or an array.
template <Json::ValueType type>
bool ReadWhole(const Json::Value& value, Json::Value& result) {
  if (value.type() != type) return false;
  result = value;
  return true;
}

template <class T, class Reader>
APIParameter<T> ReadMember(const Json::Value& object, const std::string& key, bool required,
                           const std::function<bool(const T&)>& validator, Reader read) {
  const Json::Value* member =
      object.isObject() ? object.find(key.data(), key.data() + key.size()) : nullptr;
  if (!member) return {false, required, T()};
  T value{};
  const bool good = read(*member, value) && (!validator || validator(value));
  return {true, !good, good ? std::move(value) : T()};
}

}  // namespace

template <class T>
APIParameter<T> APIParameterFactoryBasicImpl<T>::FromJson(const Json::Value& object,
                                                          const std::string& key,
                                                          PARAM_NECESSITY necessity,
                                                          const Validator& validator) {
  return ReadMember<T>(object, key, necessity == PARAM_REQUIRED, validator, Read<T>);
}

template struct APIParameterFactoryBasicImpl<std::string>;
template struct APIParameterFactoryBasicImpl<int>;
template struct APIParameterFactoryBasicImpl<double>;
template struct APIParameterFactoryBasicImpl<bool>;

APIRequest::APIRequest(Login login, Json::Value params)
    : login_(std::move(login)),
      params_(params.isObject() ? std::move(params) : Json::Value(Json::objectValue)) {}

APIParameter<std::string> APIRequest::GetAndCheckString(
    const std::string& name, PARAM_NECESSITY necessity,
    const Validator<std::string>& validator) const {
  return ReadMember<std::string>(params_, name, necessity == REQUIRED, validator,
                                 Read<std::string>);
}

APIParameter<int> APIRequest::GetAndCheckInt(const std::string& name, PARAM_NECESSITY necessity,
                                             const Validator<int>& validator) const {
  return ReadMember<int>(params_, name, necessity == REQUIRED, validator, Read<int>);
}

APIParameter<Json::Value> APIRequest::GetAndCheckObject(
    const std::string& name, PARAM_NECESSITY necessity,
    const Validator<Json::Value>& validator) const {
  return ReadMember<Json::Value>(params_, name, necessity == REQUIRED, validator,
                                 ReadWhole<Json::objectValue>);
}

APIParameter<Json::Value> APIRequest::GetAndCheckArray(
    const std::string& name, PARAM_NECESSITY necessity,
    const Validator<Json::Value>& validator) const {
  return ReadMember<Json::Value>(params_, name, necessity == REQUIRED, validator,
                                 ReadWhole<Json::arrayValue>);
}

APIParameter<Json::Value> APIRequest::GetAndCheckUnitArray(
    const std::string& name, PARAM_NECESSITY necessity,
    const Validator<Json::Value>& validator) const {
  return GetAndCheckArray(name, necessity, validator);
}

void APIResponse::SetSuccess(const Json::Value& data) {
  set_ = true;
  success_ = true;
  error_code_ = 0;
  if (!take_success_) {
    data_ = data;
  } else if (!std::exchange(taken_, true)) {
    take_success_(data);
  }
}

void APIResponse::SetError(int code, const Json::Value& data) {
  set_ = true;
  success_ = false;
  error_code_ = code;
  data_ = data;
}

}  // namespace MARU
