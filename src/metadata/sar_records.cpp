#include "metadata/sar_records.hpp"

#include <limits>

#include "base/profile.hpp"
#include "metadata/ombrixxml.hpp"

namespace sar::metadata {
namespace {

constexpr double kIntMax = std::numeric_limits<int32_t>::max();
// A header is untrusted input: its counts size buffers only up to what a data set can hold.
constexpr int32_t kMaxBursts = 1000000;

// Reads a record whose buffers are sized by counts in the same section: the counts first
// (their own binding), then the buffers, then everything.
template <class Record>
int read_sized(Record& r, bool& countsOnly, const std::string& path) {
  countsOnly = true;
  int st = r.readSection(path, 1, r.section());
  countsOnly = false;
  if (st != 0 || !r.sectionPresent(path)) return 1;
  if (r.createBuffers() != 0) return 1;
  return r.readSection(path, 1, r.section());
}

}  // namespace

bool SectionRecord::sectionPresent(const std::string& path) {
  const HeaderDialect dialect = header_dialect(path);
  ombrixxml xml;
  if (dialect == HeaderDialect::kXml && xml.initXmlFile(path) != XmlOpenResult::kOk) return false;
  for (const parElement& e : elements()) {
    const std::string key = std::string(section()) + "/" + e.name;
    if (dialect == HeaderDialect::kXml) {
      std::string value;
      if (xml.readString(1, key, std::span<std::string>(&value, 1)) == 0) return true;
    } else if (dialect == HeaderDialect::kProfile) {
      if (base::GetSetProfileChar(0, section(), e.name, "", path) != nullptr) return true;
    }
  }
  return false;
}

int SectionRecord::readhdr(const std::string& path) {
  if (readSection(path, 1, section()) != 0) return 1;
  return sectionPresent(path) ? 0 : 1;
}

int SamplingConstants_Obj::refreshParameters() {
  createElementsVector(10);
  addElementDouble("fc_hz", &fc_hz, 1, 0.0, 0.0, true);
  addElementDouble("frg_hz", &frg_hz, 1, 0.0, 0.0, true);
  addElementDouble("Brg_hz", &Brg_hz, 1, 0.0, 0.0, true);
  addElementDouble("Trg_s", &Trg_s, 1, 0.0, 0.0, true);
  addElementDouble("prf_hz", &prf_hz, 1, 0.0, 0.0, true);
  addElementDouble("pri_s", &pri_s, 1, 0.0, 0.0, true);
  addElementDouble("Baz_hz", &Baz_hz, 1, 0.0, 0.0, true);
  addElementDouble("brf_hz", &brf_hz, 1, 0.0, 0.0, true);
  addElementDouble("bri_s", &bri_s, 1, 0.0, 0.0, true);
  addElementDouble("lambda_m", &lambda_m, 1, 0.0, 0.0, true);
  return 0;
}

int SamplingConstants_Obj::clone(const SamplingConstants_Obj& other) {
  *this = other;
  return 0;
}

int DataSetInfo_Obj::refreshParameters() {
  createElementsVector(36);
  for (auto [name, field] : {std::pair{"OrbitNumber", &OrbitNumber},
                             {"Track", &Track},
                             {"SenseDate", &SenseDate},
                             {"SceneID", &SceneID},
                             {"Description", &Description},
                             {"AcquisitionStation", &AcquisitionStation},
                             {"ProcessingCenter", &ProcessingCenter},
                             {"ProcessingDate", &ProcessingDate},
                             {"ProcessingSoftware", &ProcessingSoftware}})
    addElementString(name, field, true);
  addElementDouble("SceneHeading", &SceneHeading, 1, 0.0, 0.0, false);
  addElementString("OrbitConfiguration", &OrbitConfiguration, false);
  addElementString("Polarization", &Polarization, false);
  addElementString("Swath", &Swath, false);
  addElementDouble("SWST_MIN", &SWST_MIN, 1, 0.0, 0.0, false);
  addElementDouble("SWST_MAX", &SWST_MAX, 1, 0.0, 0.0, false);
  addElementDouble("RO_REF", &RO_REF, 1, 0.0, 0.0, false);
  addElementInt("RangeLooks", &RangeLooks, 1, 1.0, 1000.0, false);
  addElementDouble("RangeBandwidth", RangeBandwidth.data(), 5, 0.0, 0.0, false);
  addElementDouble("ExternalCalibrationFactor", &ExternalCalibrationFactor, 1, 0.0, 0.0, false);
  addElementString("Projection", &Projection, false);
  addElementString("ImageType", &ImageType, false);
  for (auto [name, field] : {std::pair{"RGAntenna_flag", &RGAntenna_flag},
                             {"AZAntenna_flag", &AZAntenna_flag},
                             {"SpreadLoss_flag", &SpreadLoss_flag},
                             {"DroopGain_flag", &DroopGain_flag},
                             {"RGAntenna_AltitudeCorr_flag", &RGAntenna_AltitudeCorr_flag},
                             {"NoiseCorr_flag", &NoiseCorr_flag}})
    addElementInt(name, field, 1, 0.0, 1.0, false);
  addElementString("SensorName", &SensorName, false);
  addElementString("AcquisitionMode", &AcquisitionMode, false);
  addElementString("RefSystem", &RefSystem, false);
  addElementString("UnitType", &UnitType, false);
  addElementInt("MissingLines", &MissingLines, 1, 0.0, kIntMax, false);
  return 0;
}

int DataSetInfo_Obj::clone(const DataSetInfo_Obj& other) {
  *this = other;
  return 0;
}

int SARPulse_Obj::refreshParameters() {
  createElementsVector(5);
  addElementDouble("PulseLength", &PulseLength, 1, 0.0, 0.0, true);
  addElementDouble("Bandwidth", &Bandwidth, 1, 0.0, 0.0, true);
  addElementDouble("PulseKRate", &PulseKRate, 1, 0.0, 0.0, true);
  addElementDouble("PulseEnergy", &PulseEnergy, 1, 0.0, 0.0, true);
  addElementDouble("PulseSamplingRate", &PulseSamplingRate, 1, 0.0, 0.0, true);
  return 0;
}

int SARPulse_Obj::clone(const SARPulse_Obj& other) {
  *this = other;
  return 0;
}

int SensorAttitude_Obj::refreshParameters() {
  createElementsVector(7);
  addElementDouble("Eq_speed", &Eq_speed, 1, 0.0, 0.0, false);
  addElementDouble("Eq_distance", &Eq_distance, 1, 0.0, 0.0, false);
  addElementDouble("Mean_DC", &Mean_DC, 1, 0.0, 0.0, false);
  addElementDouble("SquintAngle", &SquintAngle, 1, 0.0, 0.0, false);
  addElementDouble("AntennaLength", &AntennaLength, 1, 0.0, 0.0, false);
  addElementDouble("DroopGain", DroopGain.data(), 8, 0.0, 0.0, false);
  addElementDouble("Temperature", &Temperature, 1, 0.0, 0.0, false);
  return 0;
}

int SensorAttitude_Obj::clone(const SensorAttitude_Obj& other) {
  *this = other;
  return 0;
}

int SpectralWindows_Obj::refreshParameters() {
  createElementsVector(6);
  addElementString("AzMatchedFilterType", &AzMatchedFilterType, false);
  addElementString("RgMatchedFilterType", &RgMatchedFilterType, false);
  addElementDouble("RgMatchedFilterCoef", &RgMatchedFilterCoef, 1, 0.0, 0.0, false);
  addElementDouble("AzMatchedFilterCoef", &AzMatchedFilterCoef, 1, 0.0, 0.0, false);
  addElementDouble("RgLookBandwidth", &RgLookBandwidth, 1, 0.0, 0.0, false);
  addElementDouble("AzLookBandwidth", &AzLookBandwidth, 1, 0.0, 0.0, false);
  return 0;
}

int SpectralWindows_Obj::clone(const SpectralWindows_Obj& other) {
  *this = other;
  return 0;
}

int SwathInfo::createBuffers() {
  if (Bursts < 0 || Bursts > kMaxBursts) return 1;
  BurstTimes.assign(static_cast<std::size_t>(Bursts), 0.0);
  return 0;
}

int SwathInfo::destroyBuffers() {
  BurstTimes.clear();
  return 0;
}

int SwathInfo::refreshParameters() {
  createElementsVector(13);
  addElementInt("Bursts", &Bursts, 1, 0.0, kMaxBursts, false);
  if (countsOnly_) return 0;
  addElementInt("Rank", &Rank, 1, 0.0, 0.0, false);
  addElementDouble("Rgate_bias", &Rgate_bias, 1, 0.0, 0.0, false);
  addElementInt("Echoes_per_burst", &Echoes_per_burst, 1, 0.0, 0.0, false);
  addElementInt("Lines_per_burst", &Lines_per_burst, 1, 0.0, 0.0, false);
  addElementInt("Order", &Order, 1, 0.0, 0.0, false);
  addElementDouble("Acquisition_Start_Time", &Acquisition_Start_Time, 1, 0.0, 0.0, false);
  addElementInt("Swst_changes", &Swst_changes, 1, 0.0, 0.0, false);
  addElementDouble("ProcessorGain", &ProcessorGain, 1, 0.0, 0.0, false);
  addElementDouble("NoisePower", &NoisePower, 1, 0.0, 0.0, false);
  addElementDouble("ChirpPower", &ChirpPower, 1, 0.0, 0.0, false);
  if (static_cast<int32_t>(BurstTimes.size()) == Bursts && Bursts > 0)
    addElementDouble("BurstTimes", BurstTimes.data(), Bursts, 0.0, 0.0, true);
  return 0;
}

int SwathInfo::readhdr(const std::string& path) { return read_sized(*this, countsOnly_, path); }

int SwathInfo::clone(const SwathInfo& other) {
  *this = other;
  return 0;
}

int geoCoords_Obj::refreshParameters() {
  createElementsVector(7);
  addElementDouble("NorthWest", NorthWest.Point.data(), 5, 0.0, 0.0, true);
  addElementDouble("NorthEast", NorthEast.Point.data(), 5, 0.0, 0.0, true);
  addElementDouble("SouthWest", SouthWest.Point.data(), 5, 0.0, 0.0, true);
  addElementDouble("SouthEast", SouthEast.Point.data(), 5, 0.0, 0.0, true);
  addElementDouble("Center", Center.Point.data(), 5, 0.0, 0.0, true);
  addElementDouble("EastingGridSize", &EastingGridSize, 1, 0.0, 0.0, false);
  addElementDouble("NorthingGridSize", &NorthingGridSize, 1, 0.0, 0.0, false);
  return 0;
}

int geoCoords_Obj::clone(const geoCoords_Obj& other) {
  *this = other;
  return 0;
}

int AntennaPattern_Obj::createBuffers() {
  if (PatternSamples < 0 || PatternSamples > 10000) return 1;
  Pattern.assign(static_cast<std::size_t>(PatternSamples), 0.0);
  return 0;
}

int AntennaPattern_Obj::destroyBuffers() {
  Pattern.clear();
  return 0;
}

int AntennaPattern_Obj::refreshParameters() {
  createElementsVector(4);
  // An empty table is a table: a data set without a pattern still has the record.
  addElementInt("PatternSamples", &PatternSamples, 1, 0.0, 10000.0, false);
  if (countsOnly_) return 0;
  addElementDouble("StartAngle", &StartAngle, 1, 0.0, 0.0, false);
  addElementDouble("DeltaAngle", &DeltaAngle, 1, 0.0, 0.0, false);
  if (static_cast<int32_t>(Pattern.size()) == PatternSamples && PatternSamples > 0)
    addElementDouble("Pattern", Pattern.data(), PatternSamples, 0.0, 0.0, true);
  return 0;
}

int AntennaPattern_Obj::readhdr(const std::string& path) { return read_sized(*this, countsOnly_, path); }

int AntennaPattern_Obj::clone(const AntennaPattern_Obj& other) {
  *this = other;
  return 0;
}

int SAROrbitStateVectors_Obj::createBuffers() {
  if (nStateVectors < 0 || nStateVectors > 100000) return 1;
  pos.assign(static_cast<std::size_t>(nStateVectors) * 3, 0.0);
  vel.assign(static_cast<std::size_t>(nStateVectors) * 3, 0.0);
  return 0;
}

int SAROrbitStateVectors_Obj::destroyBuffers() {
  pos.clear();
  vel.clear();
  return 0;
}

int SAROrbitStateVectors_Obj::refreshParameters() {
  createElementsVector(5);
  addElementInt("nStateVectors", &nStateVectors, 1, 1.0, 100000.0, true);
  if (countsOnly_) return 0;
  addElementDouble("TimeFirst", &TimeFirst, 1, 0.0, 0.0, true);
  addElementDouble("TimeDelta", &TimeDelta, 1, 0.0, 0.0, true);
  const auto n = static_cast<std::size_t>(nStateVectors) * 3;
  if (pos.size() != n || vel.size() != n) return 1;
  addElementDouble("pos", pos.data(), 3 * nStateVectors, 0.0, 0.0, true);
  addElementDouble("vel", vel.data(), 3 * nStateVectors, 0.0, 0.0, true);
  return 0;
}

int SAROrbitStateVectors_Obj::readhdr(const std::string& path) { return read_sized(*this, countsOnly_, path); }

int SAROrbitStateVectors_Obj::clone(const SAROrbitStateVectors_Obj& other) {
  *this = other;
  return 0;
}

int SAROrbitStateVectors_Obj::SVCreate(double first, double interval, int count) {
  TimeFirst = first;
  TimeDelta = interval;
  nStateVectors = count;
  return createBuffers();
}

}  // namespace sar::metadata
