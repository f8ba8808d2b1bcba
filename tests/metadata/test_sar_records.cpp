// The data set records: every bound field of every record comes back as written, in both header
// dialects; a missing required element or a value out of its range makes the record absent.
#include <unistd.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <string>
#include <variant>

#include <gtest/gtest.h>

#include "base/profile.hpp"
#include "metadata/sar_records.hpp"

namespace fs = std::filesystem;
using namespace sar::metadata;

namespace {

struct TempDir {
  fs::path dir = fs::temp_directory_path() / ("sar_records_" + std::to_string(::getpid()));
  TempDir() { fs::create_directories(dir); }
  ~TempDir() { fs::remove_all(dir); }
};

// Puts a distinct value, inside the element's range, into every bound field.
void fill(GeneralSAR_BaseXML& r) {
  int k = 0;
  for (const parElement& e : r.elements()) {
    // The counts size the buffers: they stay as the writer set them.
    if (e.name == "nStateVectors" || e.name == "Bursts" || e.name == "PatternSamples") continue;
    for (int i = 0; i < e.count; ++i, ++k) {
      const double v = e.has_range() ? e.low + (k % static_cast<int>(e.high - e.low + 1)) : 1.25 + 0.5 * k;
      std::visit(
          [&](auto p) {
            using P = decltype(p);
            if constexpr (std::is_same_v<P, double*>)
              p[i] = v * 1.000000123;
            else if constexpr (std::is_same_v<P, float*>)
              p[i] = static_cast<float>(v);
            else if constexpr (std::is_same_v<P, int32_t*> || std::is_same_v<P, int64_t*>)
              p[i] = static_cast<int>(v);
            else if constexpr (std::is_same_v<P, std::string*>)
              p[i] = "text " + std::to_string(k) + " " + e.name;
          },
          e.address);
    }
  }
}

// Every bound field of a and b, compared value by value.
void expect_same(GeneralSAR_BaseXML& a, GeneralSAR_BaseXML& b) {
  const auto& ea = a.elements();
  const auto& eb = b.elements();
  ASSERT_EQ(ea.size(), eb.size());
  for (std::size_t n = 0; n < ea.size(); ++n) {
    ASSERT_EQ(ea[n].count, eb[n].count) << ea[n].name;
    for (int i = 0; i < ea[n].count; ++i) {
      std::visit(
          [&](auto p) {
            using P = decltype(p);
            if constexpr (!std::is_same_v<P, std::monostate> && !std::is_same_v<P, std::span<char>>) {
              auto q = std::get<P>(eb[n].address);
              // Headers keep 15 significant digits.
              if constexpr (std::is_same_v<P, double*>)
                EXPECT_NEAR(p[i], q[i], 1e-14 * std::abs(p[i])) << ea[n].name << "[" << i << "]";
              else
                EXPECT_EQ(p[i], q[i]) << ea[n].name << "[" << i << "]";
            }
          },
          ea[n].address);
    }
  }
}

struct Case {
  const char* name;
  std::function<std::unique_ptr<SectionRecord>()> make;  // sized as a writer sizes it
  std::function<std::unique_ptr<SectionRecord>()> fresh;
  const char* required;  // an element whose absence makes the record absent ("" for none)
};

template <class R>
std::unique_ptr<SectionRecord> plain() {
  return std::make_unique<R>();
}

const Case kCases[] = {
    {"SamplingConstants", plain<SamplingConstants_Obj>, plain<SamplingConstants_Obj>, "prf_hz"},
    {"DataSetInfo", plain<DataSetInfo_Obj>, plain<DataSetInfo_Obj>, "SceneID"},
    {"Pulse", plain<SARPulse_Obj>, plain<SARPulse_Obj>, "PulseKRate"},
    {"SensorAttitude", plain<SensorAttitude_Obj>, plain<SensorAttitude_Obj>, ""},
    {"SpectralWindows", plain<SpectralWindows_Obj>, plain<SpectralWindows_Obj>, ""},
    {"GroundCornersPoints", plain<geoCoords_Obj>, plain<geoCoords_Obj>, "Center"},
    {"SwathInfo",
     [] {
       auto s = std::make_unique<SwathInfo>();
       s->Bursts = 3;
       s->createBuffers();
       return std::unique_ptr<SectionRecord>(std::move(s));
     },
     plain<SwathInfo>, "BurstTimes"},
    {"AntennaPattern",
     [] {
       auto s = std::make_unique<AntennaPattern_Obj>();
       s->PatternSamples = 7;
       s->createBuffers();
       return std::unique_ptr<SectionRecord>(std::move(s));
     },
     plain<AntennaPattern_Obj>, "Pattern"},
    {"StateVectorData",
     [] {
       auto s = std::make_unique<SAROrbitStateVectors_Obj>();
       s->SVCreate(0.0, 0.0, 4);
       return std::unique_ptr<SectionRecord>(std::move(s));
     },
     plain<SAROrbitStateVectors_Obj>, "vel"},
};

// Removes one key from a profile text header.
void drop_profile_key(const fs::path& file, const std::string& key) {
  std::ifstream in(file);
  std::string line, kept;
  while (std::getline(in, line))
    if (line.rfind(key + " ", 0) != 0 && line.rfind(key + "=", 0) != 0) kept += line + "\n";
  in.close();
  std::ofstream(file) << kept;
  sar::base::FreeProfile(file.string());
}

// A profile header with another section only (the cache forgets any older file of the name).
void new_profile(const fs::path& file) {
  std::ofstream(file) << "[Other]\nKey = 1\n";
  sar::base::FreeProfile(file.string());
}

}  // namespace

TEST(SarRecords, EveryFieldRoundTripsInBothDialects) {
  TempDir t;
  for (const Case& c : kCases) {
    for (const bool profile : {false, true}) {
      SCOPED_TRACE(std::string(c.name) + (profile ? " profile" : " xml"));
      const fs::path file = t.dir / (std::string(c.name) + (profile ? ".txt" : ".hdr"));
      if (profile) new_profile(file);
      auto written = c.make();
      EXPECT_STREQ(written->section(), c.name);
      fill(*written);
      ASSERT_EQ(written->writehdr(file.string()), 0);
      auto read = c.fresh();
      ASSERT_EQ(read->readhdr(file.string()), 0);
      expect_same(*written, *read);
    }
  }
}

TEST(SarRecords, MissingRequiredElementOrSectionMakesTheRecordAbsent) {
  TempDir t;
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.name);
    const fs::path file = t.dir / (std::string(c.name) + "_absent.txt");
    new_profile(file);
    // No section at all.
    EXPECT_NE(c.fresh()->readhdr(file.string()), 0);
    if (*c.required == '\0') continue;
    auto written = c.make();
    fill(*written);
    ASSERT_EQ(written->writehdr(file.string()), 0);
    ASSERT_EQ(c.fresh()->readhdr(file.string()), 0);
    drop_profile_key(file, c.required);
    EXPECT_NE(c.fresh()->readhdr(file.string()), 0);
  }
}

TEST(SarRecords, ValuesOutsideTheirRangeAreRefused) {
  TempDir t;
  const fs::path file = t.dir / "info.hdr";
  DataSetInfo_Obj info;
  fill(info);
  info.RangeLooks = 1001;  // 1 to 1000
  ASSERT_EQ(info.writehdr(file.string()), 0);
  EXPECT_NE(DataSetInfo_Obj().readhdr(file.string()), 0);
  info.RangeLooks = 1000;
  ASSERT_EQ(info.writehdr(file.string()), 0);
  EXPECT_EQ(DataSetInfo_Obj().readhdr(file.string()), 0);

  AntennaPattern_Obj pattern;
  pattern.PatternSamples = 10001;
  EXPECT_NE(pattern.createBuffers(), 0);
}
