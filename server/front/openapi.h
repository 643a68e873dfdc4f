#pragma once

#include <string_view>

namespace maru::server {

/// The description of the HTTP API (OpenAPI 3.1, JSON): openapi.json as it was when this
/// program was built.
std::string_view OpenApiText();

}  // namespace maru::server
