// Inputs the fuzzers found, kept as cases: each broke a reader of the base layer once.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "base/run_services.hpp"

namespace fs = std::filesystem;
using namespace sar::base;

namespace {

fs::path write_temp(const std::string& name, const std::string& bytes) {
  const fs::path p = fs::temp_directory_path() / ("fuzzfind_" + std::to_string(::getpid()) + "_" + name);
  std::ofstream(p, std::ios::binary) << bytes;
  return p;
}

}  // namespace

// The group count of a catalogue is checked against its lines before it sizes anything: a count
// near the largest long once overflowed while the lines needed were computed.
TEST(FuzzFindings, CatalogueGroupCountIsCheckedAgainstTheLines) {
  struct Case {
    const char* name;
    std::string text;
    bool loads;
    int groups;
  };
  const std::string oneGroup = "1\ntitle\nNO_ERROR\nspare\nSUCCESS\n";
  const Case cases[] = {
      {"largest long", std::string(118, '1') + "2\nWarni\x01N\n\x01\nError catal]o\n  fER", false, 0},
      {"negative", "-3\na\nb\nc\nd\ne\nf\ng\n", false, 0},
      {"one line short", "1\ntitle\nNO_ERROR\nspare\n", false, 0},
      {"just enough", oneGroup, true, 1},
      {"count beyond lines", "2\n" + oneGroup.substr(2), false, 0},
  };
  for (const Case& c : cases) {
    const fs::path p = write_temp("catalogue", c.text);
    ErrorCatalogue catalogue;
    EXPECT_EQ(catalogue.load(p.string()), c.loads) << c.name;
    EXPECT_EQ(catalogue.pec_count(), c.groups) << c.name;
    if (c.loads) {
      std::string primary, secondary;
      catalogue.texts(0, primary, secondary);
      EXPECT_EQ(primary, "SUCCESS") << c.name;
    }
    fs::remove(p);
  }
}
