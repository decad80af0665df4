// Runs a fuzz target, compiled into the same program, on its corpus. A finding aborts.

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <iterator>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);

namespace {

TEST(Corpus, HoldsThePropertyOfItsTarget) {
  int files = 0;
  for (const auto &entry : std::filesystem::directory_iterator(KOVA_CORPUS_DIR)) {
    std::ifstream in(entry.path(), std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(in), {}};
    const std::vector<std::uint8_t> bytes(text.begin(), text.end());
    EXPECT_EQ(0, LLVMFuzzerTestOneInput(bytes.data(), bytes.size())) << entry.path();
    ++files;
  }
  EXPECT_GT(files, 0) << "no corpus in " << KOVA_CORPUS_DIR;
}

} // namespace
