#include "webapi/param_check.h"

#include <string>

#include "common/error.h"

namespace maruseeker::webapi {
namespace {

bool Refuse(MARU::APIResponse* response, const char* name, const char* reason) {
  Json::Value data(Json::objectValue);
  data["name"] = name;
  data["reason"] = reason;
  response->SetError(kErrorBadParameter, data);
  return false;
}

template <class T>
bool Reads(const Json::Value& item, const char* key) {
  return !MARU::APIParameterFactoryBasicImpl<T>::FromJson(item, key, MARU::PARAM_OPTIONAL, nullptr)
              .IsInvalid();
}

}  // namespace

bool CheckParams(MARU::APIResponse* response, std::initializer_list<ReadParam> params) {
  for (const ReadParam& param : params) {
    if (param.is_invalid) return Refuse(response, param.name, param.is_set ? "type" : "required");
  }
  return true;
}

bool CheckElements(MARU::APIResponse* response, const char* name,
                   const MARU::APIParameter<Json::Value>& array, ElementCheck check) {
  if (!array.IsSet()) return true;
  for (const Json::Value& element : array.Get()) {
    if (!check(element)) return Refuse(response, name, "type");
  }
  return true;
}

bool CheckObject(MARU::APIResponse* response, const char* name,
                 const MARU::APIParameter<Json::Value>& object, ElementCheck check) {
  return !object.IsSet() || check(object.Get()) || Refuse(response, name, "type");
}

bool IsString(const Json::Value& element) {
  return element.isString();
}
bool IsIntegral(const Json::Value& element) {
  return element.isIntegral();
}

bool IsWeight(const Json::Value& element) {
  return element.isObject() && CheckWeightItem(element);
}

bool IsCriteria(const Json::Value& element) {
  return element.isObject() && CheckCriteriaItem(element);
}

bool IsHighlight(const Json::Value& element) {
  return element.isObject() && CheckHighlightItem(element);
}

bool CheckWeightItem(const Json::Value& item) {
  return Reads<double>(item, "weight") && Reads<std::string>(item, "field");
}

bool CheckCriteriaItem(const Json::Value& item) {
  return Reads<std::string>(item, "value") && Reads<std::string>(item, "field");
}

bool CheckHighlightItem(const Json::Value& item) {
  return Reads<int>(item, "frag_length") && Reads<int>(item, "num_fragments") &&
         Reads<std::string>(item, "field");
}

bool AcceptAll(MARU::APIRequest*, MARU::APIResponse*) {
  return true;
}

}  // namespace maruseeker::webapi
