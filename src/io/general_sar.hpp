#pragma once
// Data sets: a raster plus everything known about it, in one header file.
//
// GeneralSAR is the general container: a slot per record, each of which may be absent. Reading
// tries every slot and remembers which were found; writing writes the slots marked present, in
// the reverse order of reading. All slots work on the header path as given ("R_slc.hdr"): the
// raster and buffer descriptions, whose own calls take the raster's name, get the path without
// its ".hdr".
//
// GeneralRAWData and GeneralSLCData are the fixed sets of a raw and a focused data set: their
// records are required, and a missing one fails the read.
#include <array>
#include <cstdint>
#include <string>

#include "io/buffer_file.hpp"
#include "io/data_file.hpp"
#include "io/roi.hpp"
#include "metadata/poly_sar.hpp"
#include "metadata/sar_records.hpp"

namespace sar::io {

/// The raster's description ("RasterInfo") as a record of the header path.
class GSDataFile_Obj : public DataFile {
 public:
  int readhdr(const std::string& path) override;
  int writehdr(const std::string& path) override;
};

/// The region of interest, section "Roi".
class GSRoi_Obj : public ROI_Obj {
 public:
  int readhdr(const std::string& path) override { return read_roi(path, "Roi") ? 0 : 1; }
  /// In the dialect of the header already there; a new header is XML like the other records'.
  int writehdr(const std::string& path) override { return writeSection(path, 1, "Roi"); }
};

/// The raster's description as a buffered stream, a record of the header path.
class GSBufferFile_Obj : public BufferFile {
 public:
  int readhdr(const std::string& path) override;
  int writehdr(const std::string& path) override;
};

/// The slots, in the order everything that walks them uses.
enum GSObject : int {
  kGSDataFile = 0,
  kGSRoi = 1,
  kGSPolySAR = 2,
  kGSSamplingConstants = 3,
  kGSStateVectors = 4,
  kGSOrbit = 5,
  kGSPulse = 6,
  kGSAntennaPattern = 7,
  kGSDataSetInfo = 8,
  kGSSensorAttitude = 9,
  kGSSpectralWindows = 10,
  kGSGeoCoords = 11,
  kGSSwathInfo = 12,
  kGSBufferFile = 13,
  kGSObjects = 14,
};

/// The header path of a raster: "<raster>.hdr".
std::string header_of(const std::string& raster);

class GeneralSAR : public metadata::GeneralSAR_BaseXML {
 public:
  GSDataFile_Obj dataFile;
  GSRoi_Obj roi;
  metadata::polySAR polys;
  metadata::SamplingConstants_Obj sampling;
  metadata::SAROrbitStateVectors_Obj stateVectors;
  metadata::GeneralSAROrbit orbit;
  metadata::SARPulse_Obj pulse;
  metadata::AntennaPattern_Obj pattern;
  metadata::DataSetInfo_Obj info;
  metadata::SensorAttitude_Obj attitude;
  metadata::SpectralWindows_Obj windows;
  metadata::geoCoords_Obj corners;
  metadata::SwathInfo swath;
  GSBufferFile_Obj buffer;

  GeneralSAR() = default;
  GeneralSAR(const GeneralSAR&) = delete;
  GeneralSAR& operator=(const GeneralSAR&) = delete;

  /// Reads every slot from `path`. 1 (with "File : %s DOES NOT EXIST!" at level 0) when the
  /// file is missing; otherwise 0, whatever was found.
  int GSread(const std::string& path);
  /// Writes every present slot, slot 13 first. 0, or the first failing slot's status.
  int GSwrite(const std::string& path);
  int GSclone(const GeneralSAR& other);
  /// Marks every slot absent and frees the records' buffers.
  void GSdestroy();
  /// Marks a slot present (its record is then written) or absent.
  void GSenable(GSObject slot, bool present = true) { exists_.at(static_cast<std::size_t>(slot)) = present ? 1 : 0; }
  bool GSexists(GSObject slot) const { return exists_.at(static_cast<std::size_t>(slot)) != 0; }
  metadata::GeneralSAR_Base& GSget(GSObject slot);

  int readhdr(const std::string& path) override { return GSread(path); }
  int writehdr(const std::string& path) override { return GSwrite(path); }

 private:
  std::array<uint8_t, kGSObjects> exists_{};
};

/// Raw data set: raster, region and the six records a raw raster needs to be focused
/// (sampling constants, state vectors, pulse, data set info, sensor attitude, swath info).
class GeneralRAWData : public GeneralSAR {
 public:
  /// Reads "<raster>.hdr"; 1 with "Called function returned ERROR" at the first missing record.
  int readhdr(const std::string& raster) override;
  /// Marks the fixed set present and writes it to "<raster>.hdr".
  int writehdr(const std::string& raster) override;
};

/// Focused data set: raster, region, polynomials, sampling constants, state vectors, pulse,
/// antenna pattern, data set info, sensor attitude, spectral windows and ground corners.
class GeneralSLCData : public GeneralSAR {
 public:
  int readhdr(const std::string& raster) override;
  int writehdr(const std::string& raster) override;
};

}  // namespace sar::io
