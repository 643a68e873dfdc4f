#include "server/front/openapi.h"

// The file goes into the program as it is.
asm(".section .rodata\n"
    ".global maru_openapi_begin\n"
    ".global maru_openapi_end\n"
    "maru_openapi_begin:\n"
    ".incbin \"" MARU_OPENAPI_FILE
    "\"\n"
    "maru_openapi_end:\n"
    ".byte 0\n"
    ".previous\n");

extern "C" const char maru_openapi_begin[];
extern "C" const char maru_openapi_end[];

namespace maru::server {

std::string_view OpenApiText() {
  return {maru_openapi_begin, static_cast<std::size_t>(maru_openapi_end - maru_openapi_begin)};
}

}  // namespace maru::server
