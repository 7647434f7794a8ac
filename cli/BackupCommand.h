#pragma once

#include "cli/Command.h"

namespace kx::cli {

// Each adds its command below `app`; when it was chosen, parsing stores its action.
void addBackupCommand(CLI::App& app, Action& chosen);
void addMetricsCommand(CLI::App& app, Action& chosen);
void addBackupPathsCommand(CLI::App& app, Action& chosen);

}  // namespace kx::cli
