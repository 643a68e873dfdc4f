#include <gtest/gtest.h>
#include <stdio.h>

#include <algorithm>
#include <array>
#include <string>

namespace {

/// Whether it is a name, or what belongs to a class, that the plug-in has from the platform.
bool IsOfTheFacade(std::string symbol) {
  for (const std::string before : {"vtable for ", "typeinfo for ", "typeinfo name for "}) {
    if (symbol.starts_with(before)) symbol.erase(0, before.size());
  }
  constexpr std::array kFacade{"FILEIDX",       "MARU",         "MLIB",
                               "marudbquery::", "maruseeker::", "ResetCredentialsByName("};
  return std::any_of(kFacade.begin(), kFacade.end(),
                     [&](const char* name) { return symbol.starts_with(name); });
}

TEST(Exports, AreTheFacadeOnly) {
  FILE* names = popen("nm -DC --defined-only '" MARU_PLATFORM "'", "r");
  ASSERT_NE(names, nullptr);
  int count = 0;
  char line[1024];
  for (; fgets(line, sizeof(line), names); ++count) {
    EXPECT_TRUE(IsOfTheFacade(std::string(line).substr(std::string("0123456789abcdef T ").size())))
        << line;
  }
  EXPECT_EQ(pclose(names), 0);
  EXPECT_GT(count, 50);
}

}  // namespace
