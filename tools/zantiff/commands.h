// The tool's commands, each registered on the main application.
#pragma once

#include <CLI/CLI.hpp>

namespace zantool {

// append, extract, split, set-tags
void AddPageCommands(CLI::App& app, int& status);

// info, decode
void AddReadCommands(CLI::App& app, int& status);

// encode, copy
void AddWriteCommands(CLI::App& app, int& status);

}  // namespace zantool
