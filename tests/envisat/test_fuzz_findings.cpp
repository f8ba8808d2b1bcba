// Inputs the fuzzers found, kept as cases: each made a level 0 or auxiliary reader misbehave once.
#include <gtest/gtest.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/level0_format.hpp"
#include "envisat/table_builder.hpp"

namespace fs = std::filesystem;
using namespace sar::envisat;

namespace {

const std::string kRealIm0 = std::string(SAR_REAL_DATA_DIR) +
                             "/ASA_IM__0P_truncated/ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1";

std::vector<std::uint8_t> real_bytes() {
  std::ifstream in(kRealIm0, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

fs::path write_temp(const std::string& name, const std::vector<std::uint8_t>& bytes) {
  const fs::path p = fs::temp_directory_path() / ("fuzzfind_" + std::to_string(::getpid()) + "_" + name);
  std::ofstream(p, std::ios::binary).write(reinterpret_cast<const char*>(bytes.data()),
                                           static_cast<std::streamsize>(bytes.size()));
  return p;
}

}  // namespace

// The resynchronisation search scores every byte offset; scoring once formatted a message for
// each failed test whether or not anybody asked, and a megabyte without a clean head took the
// fuzzer's whole second. The messages themselves must not change.
TEST(FuzzFindings, HeadScoreMessagesAreTheLastFailedTest) {
  const auto bytes = real_bytes();
  ASSERT_GT(bytes.size(), 3203u + 68u);
  std::array<std::uint8_t, 68> clean{};
  std::copy_n(bytes.begin() + 3203, 68, clean.begin());
  struct Case {
    const char* name;
    std::size_t at;
    std::uint8_t value;
    int score;
    const char* message;
  };
  const Case cases[] = {
      {"clean", 0, clean[0], 0, ""},
      {"counter", 50, static_cast<std::uint8_t>(clean[50] ^ 1), 12, "Counter ERROR: MODE COUNTER="},
      {"mode id", 41, 0, 4, "ModeID ERROR: read=0, expected=84\n"},
      {"field header", 39, 30, 4, "Header length ERROR: read=30, expected=29\n"},
      {"swath", 51, 0, 12, "Swath -1 out of range.\n"},
  };
  for (const Case& c : cases) {
    auto head = clean;
    head[c.at] = c.value;
    std::string message = "unchanged";
    EXPECT_EQ(check_packet_header(head, kModeIM, &message), c.score) << c.name;
    EXPECT_EQ(message.rfind(c.message, 0), 0u) << c.name << ": " << message;
    EXPECT_EQ(check_packet_header(head, kModeIM), c.score) << c.name;
  }
}

TEST(FuzzFindings, SearchOverAMegabyteWithoutACleanHeadIsQuick) {
  auto bytes = real_bytes();
  bytes.resize(3203);
  bytes.resize(3203 + (1 << 20), 0x5a);
  const fs::path p = write_temp("noclean.N1", bytes);
  const auto start = std::chrono::steady_clock::now();
  bool raised = false;
  try {
    first_packet(p.string(), kModeIM);
  } catch (const sar::base::CErrorExceptionManager& e) {
    raised = true;
    EXPECT_EQ(e.ec(), sar::base::ec::kFileIo);
  }
  const double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  EXPECT_TRUE(raised);
  EXPECT_LT(seconds, 1.0);
  fs::remove(p);
}
