#pragma once
// The records that describe a data set, each bound to one section of its header file (XML
// dialect first, profile text otherwise; see base_xml.hpp). A record's readhdr(path) returns 0
// when the section is there with every required element in range, 1 otherwise; writehdr(path)
// writes the section in the dialect of the file already there (new files are XML). Strings keep
// up to 512 characters.
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "metadata/base_xml.hpp"

namespace sar::metadata {

/// Every section-bound record: one section, read and written through the binding.
/// A record is present when its section holds at least one of its elements and every required
/// one: a record without required elements is not conjured up from a header that lacks it.
class SectionRecord : public GeneralSAR_BaseXML {
 public:
  int readhdr(const std::string& path) override;
  int writehdr(const std::string& path) override { return writeSection(path, 1, section()); }
  virtual const char* section() const = 0;
  /// True when `path` holds any bound element in the record's section.
  bool sectionPresent(const std::string& path);
};

/// Section "SamplingConstants": rates and intervals of the two axes, all required.
class SamplingConstants_Obj : public SectionRecord {
 public:
  double fc_hz = 0.0, frg_hz = 0.0, Brg_hz = 0.0, Trg_s = 0.0, prf_hz = 0.0, pri_s = 0.0, Baz_hz = 0.0, brf_hz = 0.0,
         bri_s = 0.0, lambda_m = 0.0;
  int refreshParameters() override;
  const char* section() const override { return "SamplingConstants"; }
  int clone(const SamplingConstants_Obj& other);
};

/// Section "DataSetInfo": where the data come from.
class DataSetInfo_Obj : public SectionRecord {
 public:
  std::string OrbitNumber, Track, SenseDate, SceneID, Description, AcquisitionStation, ProcessingCenter, ProcessingDate,
      ProcessingSoftware;
  double SceneHeading = 0.0;
  std::string OrbitConfiguration, Polarization, Swath;
  double SWST_MIN = 0.0, SWST_MAX = 0.0, RO_REF = 0.0;
  int32_t RangeLooks = 1;
  std::array<double, 5> RangeBandwidth{};
  double ExternalCalibrationFactor = 0.0;
  std::string Projection, ImageType;
  int32_t RGAntenna_flag = 0, AZAntenna_flag = 0, SpreadLoss_flag = 0, DroopGain_flag = 0,
          RGAntenna_AltitudeCorr_flag = 0, NoiseCorr_flag = 0;
  std::string SensorName, AcquisitionMode, RefSystem, UnitType;
  int32_t MissingLines = 0;

  int refreshParameters() override;
  const char* section() const override { return "DataSetInfo"; }
  int clone(const DataSetInfo_Obj& other);
  /// "OMBRIX Tarvis" as processing centre.
  void fillOMBRIX() { ProcessingCenter = "OMBRIX Tarvis"; }
};

/// Section "Pulse": the transmitted chirp, all required.
class SARPulse_Obj : public SectionRecord {
 public:
  double PulseLength = 0.0, Bandwidth = 0.0, PulseKRate = 0.0, PulseEnergy = 0.0, PulseSamplingRate = 0.0;
  int refreshParameters() override;
  const char* section() const override { return "Pulse"; }
  int clone(const SARPulse_Obj& other);
};

/// Section "SensorAttitude".
class SensorAttitude_Obj : public SectionRecord {
 public:
  double Eq_speed = 0.0, Eq_distance = 0.0, Mean_DC = 0.0, SquintAngle = 0.0, AntennaLength = 0.0;
  std::array<double, 8> DroopGain{};
  double Temperature = 0.0;
  int refreshParameters() override;
  const char* section() const override { return "SensorAttitude"; }
  int clone(const SensorAttitude_Obj& other);
};

/// Section "SpectralWindows": the matched filters' windows and processed bands.
class SpectralWindows_Obj : public SectionRecord {
 public:
  std::string AzMatchedFilterType, RgMatchedFilterType;
  double RgMatchedFilterCoef = 0.0, AzMatchedFilterCoef = 0.0, RgLookBandwidth = 0.0, AzLookBandwidth = 0.0;
  int refreshParameters() override;
  const char* section() const override { return "SpectralWindows"; }
  int clone(const SpectralWindows_Obj& other);
};

/// Section "SwathInfo": the swath's place in the acquisition and its burst structure (none for
/// stripmap data: zero bursts and no burst times).
class SwathInfo : public SectionRecord {
 public:
  int32_t Rank = 0;
  double Rgate_bias = 0.0;
  int32_t Echoes_per_burst = 0, Lines_per_burst = 0, Bursts = 0, Order = 0;
  double Acquisition_Start_Time = 0.0;
  int32_t Swst_changes = 0;
  double ProcessorGain = 0.0, NoisePower = 0.0, ChirpPower = 0.0;
  std::vector<double> BurstTimes;  ///< one a burst, made by createBuffers from Bursts

  int createBuffers() override;
  int destroyBuffers() override;
  int refreshParameters() override;
  /// Reads the counts, sizes the burst times, then reads the whole section.
  int readhdr(const std::string& path) override;
  const char* section() const override { return "SwathInfo"; }
  int clone(const SwathInfo& other);

 private:
  bool countsOnly_ = false;
};

/// One corner: latitude, longitude, height, azimuth time, range time.
struct geopoint {
  std::array<double, 5> Point{};
};

/// Section "GroundCornersPoints": the four corners and the centre.
class geoCoords_Obj : public SectionRecord {
 public:
  geopoint NorthWest, NorthEast, SouthWest, SouthEast, Center;
  double EastingGridSize = 0.0, NorthingGridSize = 0.0;
  int refreshParameters() override;
  const char* section() const override { return "GroundCornersPoints"; }
  int clone(const geoCoords_Obj& other);
};

/// Section "AntennaPattern": a gain table over elevation angle (may be empty).
class AntennaPattern_Obj : public SectionRecord {
 public:
  double StartAngle = 0.0, DeltaAngle = 0.0;
  int32_t PatternSamples = 0;
  std::vector<double> Pattern;  ///< PatternSamples values, made by createBuffers

  int createBuffers() override;
  int destroyBuffers() override;
  int refreshParameters() override;
  int readhdr(const std::string& path) override;
  const char* section() const override { return "AntennaPattern"; }
  int clone(const AntennaPattern_Obj& other);

 private:
  bool countsOnly_ = false;
};

/// Section "StateVectorData": n Earth-fixed state vectors at TimeFirst + k TimeDelta (sec85).
class SAROrbitStateVectors_Obj : public SectionRecord {
 public:
  int32_t nStateVectors = 0;
  double TimeFirst = 0.0, TimeDelta = 0.0;
  std::vector<double> pos, vel;  ///< nStateVectors x 3, metres and metres a second

  int createBuffers() override;
  int destroyBuffers() override;
  int refreshParameters() override;
  int readhdr(const std::string& path) override;
  const char* section() const override { return "StateVectorData"; }
  int clone(const SAROrbitStateVectors_Obj& other);

  /// Sizes the vectors for `count` states from `first` every `interval` seconds.
  int SVCreate(double first, double interval, int count);
  void SVDestroy() { destroyBuffers(); }

 private:
  bool countsOnly_ = false;
};

/// The orbit as the data set's geometry sees it: the same state vectors plus the wavelength,
/// which the container hands over from the sampling constants. It owns no section of its own
/// (the state vector record writes it) and counts as present when the state vectors are.
class GeneralSAROrbit : public SAROrbitStateVectors_Obj {
 public:
  double lambda = 0.0;
  void setLambda(double wavelength) { lambda = wavelength; }
  int writehdr(const std::string& /*path*/) override { return 0; }
  int clone(const GeneralSAROrbit& other) {
    lambda = other.lambda;
    return SAROrbitStateVectors_Obj::clone(other);
  }
};

}  // namespace sar::metadata
