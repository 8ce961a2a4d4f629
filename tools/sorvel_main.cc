// sorvel: encode tokens to WAV and decode them from files or live PCM.
#include <cstdlib>
#include <iostream>

#include "CLI/CLI.hpp"
#include "base/logging.h"
#include "tools/decode_command.h"
#include "tools/encode_command.h"
#include "tools/simulate_command.h"

int main(int argc, char** argv) {
  CLI::App app{
      "Sorvel acoustic data modem: short tokens over near-ultrasonic sound."};
  app.set_version_flag("--version", "sorvel 0.1.0");
  int verbosity = 0;
  app.add_option("-v,--verbosity", verbosity,
                 "Log level for detailed library messages (0 = off)")
      ->check(CLI::NonNegativeNumber);
  app.require_subcommand(0, 1);
  app.parse_complete_callback([&] { sorvel_base::SetVlogLevel(verbosity); });

  int exit_code = EXIT_SUCCESS;
  sorvel_cli::RegisterEncodeCommand(&app, &exit_code);
  sorvel_cli::RegisterDecodeCommand(&app, &exit_code);
  sorvel_cli::RegisterSimulateCommand(&app, &exit_code);
  sorvel_cli::RegisterEvalCommand(&app, &exit_code);

  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    const int code = app.exit(e);
    return code == 0 ? 0 : sorvel_cli::kUsageError;
  }
  if (app.get_subcommands().empty()) std::cout << app.help();
  return exit_code;
}
