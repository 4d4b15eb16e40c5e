#include <glog/logging.h>
#include <gtest/gtest.h>

int main(int argc, char** argv) {
  testing::InitGoogleTest(&argc, argv);
  google::InitGoogleLogging(argv[0]);
  // Fatal checks are part of what the tests look at: keep them on stderr.
  FLAGS_logtostderr = true;
  // Death tests of a multi-threaded process (OpenBLAS starts threads) must
  // re-execute the binary rather than fork it half-initialised.
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  return RUN_ALL_TESTS();
}
