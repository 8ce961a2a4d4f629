// The main() of every unit test binary.
#include "gtest/gtest.h"

int main(int argc, char** argv) {
  // Death tests re-run the binary for the dying statement instead of forking
  // the running process: forked children hang under qemu-user (the arm64
  // stage), and re-running is safe when a test has started threads.
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  testing::InitGoogleTest(&argc, argv);
  return RUN_ALL_TESTS();
}
