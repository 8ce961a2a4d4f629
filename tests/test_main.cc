// The main() of every unit test binary.
#include <cstdlib>
#include <sstream>
#include <string>
#include <vector>

#include "gtest/gtest.h"

int main(int argc, char** argv) {
  // Death tests re-run the binary for the dying statement instead of forking
  // the running process: a forked child hangs under qemu-user (the arm64
  // stage), and re-running is safe when a test has started threads.
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  testing::InitGoogleTest(&argc, argv);
  // Under an emulator (cross builds; ctest sets the variable to its command
  // line) the re-run goes through it too: without a binfmt handler the
  // kernel cannot start a foreign binary, and the child would "die" of the
  // failed exec whatever the statement does.
  if (const char* emulator = std::getenv("SORVEL_TEST_EMULATOR"); emulator && *emulator) {
    std::vector<std::string> args;
    std::istringstream words(emulator);
    for (std::string word; words >> word;) args.push_back(word);
    for (const std::string& arg : testing::internal::GetArgvs()) args.push_back(arg);
    testing::internal::SetInjectableArgvs(args);
  }
  return RUN_ALL_TESTS();
}
