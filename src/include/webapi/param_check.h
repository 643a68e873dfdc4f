#pragma once

#include <json/value.h>

#include <initializer_list>

#include "platform/webapi.h"

/// What the check functions share. They judge which of the raw parameters are there and of which
/// type; what the values mean is for the handlers. True lets a request pass. A refusal is an answer
/// of error 120, {"name", "reason"}, and false. No input makes one throw.
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

/// Refuses the first bad one, for its "type" or, where it is missing, as "required".
bool CheckParams(MARU::APIResponse* response, std::initializer_list<ReadParam> params);

using ElementCheck = bool (*)(const Json::Value& element);

/// One element that fails the check is enough to refuse, for the "type". An absent array passes.
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
