#include "daemon/language/filters.h"

namespace maru::daemon {
namespace {

constexpr std::size_t kMaxFilters = 256;
constexpr std::size_t kMaxFilterData = 4096;

}  // namespace

Filters ReadFilters(const Arguments& arguments) {
  Filters filters;
  for (const Json::Value& item : arguments.Array("filters", kMaxFilters)) {
    const Arguments filter(item, arguments.NameOf("filters"), {"name", "data"});
    const std::string name = filter.String("name", kMaxFilterData);
    if (name != "permission" && name != "file_type") {
      throw BadParameter("Unknown filter " + Quoted(name));
    }
    if (!filter.Has("data")) filter.Refuse("data", "is missing");
    auto& list = name == "permission" ? filters.users : filters.types;
    list.push_back(filter.String("data", kMaxFilterData));
  }
  return filters;
}

}  // namespace maru::daemon
