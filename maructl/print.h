#pragma once

#include <string>
#include <vector>

namespace maru::control {

/// For a terminal: control characters, which a file's name may hold, as "?".
std::string Printable(std::string text);

/// Prints rows as columns, each as wide as its widest cell.
void PrintTable(const std::vector<std::vector<std::string>>& rows);

}  // namespace maru::control
