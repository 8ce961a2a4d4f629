// `sorvel simulate` (a token through a simulated room) and `sorvel eval`
// (the link-quality report).
#ifndef TOOLS_SIMULATE_COMMAND_H_
#define TOOLS_SIMULATE_COMMAND_H_

#include "CLI/CLI.hpp"

namespace sorvel_cli {

void RegisterSimulateCommand(CLI::App* app, int* exit_code);
void RegisterEvalCommand(CLI::App* app, int* exit_code);

}  // namespace sorvel_cli

#endif  // TOOLS_SIMULATE_COMMAND_H_
