#pragma once

#include <CLI/CLI.hpp>

namespace orvanta::ctl {

// Each adds one subcommand to `app`. When the command line names it, it runs from the parser's callback and leaves its
// exit status (Output.h) in `status`, which outlives the parser.
void addSessionCommand(CLI::App& app, int& status);
void addSendCommand(CLI::App& app, int& status);
void addStatesCommand(CLI::App& app, int& status);
void addDisplayURLCommand(CLI::App& app, int& status);
void addWatchCommand(CLI::App& app, int& status);
void addUploadCommand(CLI::App& app, int& status);
void addUploadLogCommand(CLI::App& app, int& status);
void addDefaultsCommand(CLI::App& app, int& status);

}  // namespace orvanta::ctl
