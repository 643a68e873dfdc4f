#pragma once

#include <json/value.h>

#include <initializer_list>

#include "platform/webapi.h"

/// What the check functions share. A check function looks at types and presence of the raw
/// parameters, never at their meaning. It accepts by returning true; it refuses by answering error
/// 120 with {"name", "reason"} and returning false. It never throws on bad input.
namespace maruseeker::webapi {

/// How a parameter was found, under its name.
struct ReadParam {
  template <class T>
  ReadParam(const char* param_name, const MARU::APIParameter<T>& param)
      : name(param_name), is_set(param.IsSet()), is_invalid(param.IsInvalid()) {}

  const char* name;
  bool is_set;
  bool is_invalid;
};

/// Refuses for the first invalid one: "type" when it is present, "required" when it is not.
bool CheckParams(MARU::APIResponse* response, std::initializer_list<ReadParam> params);

using ElementCheck = bool (*)(const Json::Value& element);

/// Refuses with "type" at the first element that fails the check. An absent array passes.
bool CheckElements(MARU::APIResponse* response, const char* name,
                   const MARU::APIParameter<Json::Value>& array, ElementCheck check);

/// The same for an object parameter as a whole.
bool CheckObject(MARU::APIResponse* response, const char* name,
                 const MARU::APIParameter<Json::Value>& object, ElementCheck check);

bool IsString(const Json::Value& element);
bool IsIntegral(const Json::Value& element);

/// Objects with, where the key is present: a number "weight" and a string "field".
bool IsWeight(const Json::Value& element);
/// A string "value" and a string "field".
bool IsCriteria(const Json::Value& element);
/// Integers "frag_length" and "num_fragments" and a string "field".
bool IsHighlight(const Json::Value& element);

/// The same for items already known to be objects.
bool CheckWeightItem(const Json::Value& item);
bool CheckCriteriaItem(const Json::Value& item);
bool CheckHighlightItem(const Json::Value& item);

/// The check of methods without parameters.
bool AcceptAll(MARU::APIRequest* request, MARU::APIResponse* response);

}  // namespace maruseeker::webapi
