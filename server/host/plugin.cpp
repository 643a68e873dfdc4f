#include "server/host/plugin.h"

#include <dlfcn.h>

#include <stdexcept>

namespace maru::server {
namespace {

template <class Row>
const Row* FindRow(const Row* row, const char* api, std::uintptr_t version, const char* method) {
  const std::string_view wanted_api = api;
  const std::string_view wanted_method = method;
  for (; row->api; ++row)
    if (row->version == version && wanted_api == row->api && wanted_method == row->method)
      return row;
  return nullptr;
}

template <class Row>
const Row* LoadTable(void* library, const char* accessor) {
  const auto function = reinterpret_cast<const Row* (*)()>(dlsym(library, accessor));
  const Row* table = function ? function() : nullptr;
  if (!table) throw std::runtime_error(std::string("the plug-in has no ") + accessor);
  return table;
}

}  // namespace

Plugin::Plugin(const std::string& path) {
  void* library = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!library) throw std::runtime_error(std::string("the plug-in cannot be loaded: ") + dlerror());
  rows_ = LoadTable<MARU::APIRow>(library, "GetAPITable");
  checks_ = LoadTable<MARU::APICheckRow>(library, "GetAPICheckTable");
  for (const MARU::APIRow* row = rows_; row->api; ++row) {
    const auto* check = FindRow(checks_, row->api, row->version, row->method);
    if (!row->entry || !check || !check->check)
      throw std::runtime_error(std::string("the plug-in has no entry or check function for ") +
                               row->api + " " + row->method);
  }
}

Plugin::Method Plugin::Find(const MethodName& name) const {
  const auto* row = FindRow(rows_, name.api.c_str(), name.version, name.method.c_str());
  if (!row) return {};
  const auto* check = FindRow(checks_, row->api, row->version, row->method);
  return {check->check, row->entry};
}

}  // namespace maru::server
