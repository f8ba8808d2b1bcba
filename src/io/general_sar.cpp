#include "io/general_sar.hpp"

#include <cstdio>
#include <span>

#include "base/diagnostics.hpp"

namespace sar::io {
namespace {

constexpr std::string_view kHeaderSuffix = ".hdr";

// The raster's name behind a header path; a path without the suffix names the raster itself.
std::string raster_of(const std::string& header) {
  if (header.size() > kHeaderSuffix.size() &&
      header.compare(header.size() - kHeaderSuffix.size(), kHeaderSuffix.size(), kHeaderSuffix) == 0)
    return header.substr(0, header.size() - kHeaderSuffix.size());
  return header;
}

bool file_exists(const std::string& path) {
  const base::ErrnoGuard keep;
  std::FILE* f = std::fopen(path.c_str(), "rb");
  if (f == nullptr) return false;
  std::fclose(f);
  return true;
}

// Reads the slots of a fixed set in their order; the first that is missing fails the read.
int read_fixed(GeneralSAR& gs, const std::string& raster, std::span<const GSObject> slots, const char* name) {
  base::Frame frame(name);
  const std::string header = header_of(raster);
  if (!file_exists(header)) {
    base::report(base::kReportError, "File : " + header + " DOES NOT EXIST!");
    return 1;
  }
  gs.GSdestroy();
  for (const GSObject slot : slots) {
    if (gs.GSget(slot).readhdr(header) != 0) {
      base::report(base::kReportErrorCallTree, "Called function returned ERROR");
      return 1;
    }
    gs.GSenable(slot);
  }
  // The orbit is the state vectors seen with the wavelength.
  if (gs.GSexists(kGSStateVectors)) {
    gs.orbit.SAROrbitStateVectors_Obj::clone(gs.stateVectors);
    gs.GSenable(kGSOrbit);
    if (gs.GSexists(kGSSamplingConstants)) gs.orbit.setLambda(gs.sampling.lambda_m);
  }
  return 0;
}

int write_fixed(GeneralSAR& gs, const std::string& raster, std::span<const GSObject> slots) {
  for (int s = 0; s < kGSObjects; ++s) gs.GSenable(static_cast<GSObject>(s), false);
  for (const GSObject slot : slots) gs.GSenable(slot);
  gs.dataFile.fileName = raster;
  return gs.GSwrite(header_of(raster));
}

constexpr std::array<GSObject, 8> kRawSlots = {kGSDataFile, kGSRoi,         kGSSamplingConstants, kGSStateVectors,
                                               kGSPulse,    kGSDataSetInfo, kGSSensorAttitude,    kGSSwathInfo};
constexpr std::array<GSObject, 11> kSlcSlots = {
    kGSDataFile,       kGSRoi,         kGSPolySAR,        kGSSamplingConstants, kGSStateVectors, kGSPulse,
    kGSAntennaPattern, kGSDataSetInfo, kGSSensorAttitude, kGSSpectralWindows,   kGSGeoCoords};

}  // namespace

std::string header_of(const std::string& raster) { return raster + std::string(kHeaderSuffix); }

int GSDataFile_Obj::readhdr(const std::string& path) {
  if (read_hdr(raster_of(path)) != 0) return 1;
  fileName = raster_of(path);
  return 0;
}

int GSDataFile_Obj::writehdr(const std::string& path) {
  fileName = raster_of(path);
  return write_hdr();
}

int GSBufferFile_Obj::readhdr(const std::string& path) { return BufferFile::readhdr(raster_of(path)); }

int GSBufferFile_Obj::writehdr(const std::string& path) { return BufferFile::writehdr(raster_of(path)); }

metadata::GeneralSAR_Base& GeneralSAR::GSget(GSObject slot) {
  switch (slot) {
    case kGSDataFile:
      return dataFile;
    case kGSRoi:
      return roi;
    case kGSPolySAR:
      return polys;
    case kGSSamplingConstants:
      return sampling;
    case kGSStateVectors:
      return stateVectors;
    case kGSOrbit:
      return orbit;
    case kGSPulse:
      return pulse;
    case kGSAntennaPattern:
      return pattern;
    case kGSDataSetInfo:
      return info;
    case kGSSensorAttitude:
      return attitude;
    case kGSSpectralWindows:
      return windows;
    case kGSGeoCoords:
      return corners;
    case kGSSwathInfo:
      return swath;
    case kGSBufferFile:
    case kGSObjects:
      break;
  }
  return buffer;
}

void GeneralSAR::GSdestroy() {
  exists_.fill(0);
  polys.DestroyPolys();
  stateVectors.destroyBuffers();
  orbit.destroyBuffers();
  pattern.destroyBuffers();
  swath.destroyBuffers();
}

int GeneralSAR::GSread(const std::string& path) {
  base::Frame frame("GeneralSAR::GSread");
  if (!file_exists(path)) {
    base::report(base::kReportError, "File : " + path + " DOES NOT EXIST!");
    return 1;
  }
  GSdestroy();
  for (int s = 0; s < kGSObjects; ++s) {
    exists_[static_cast<std::size_t>(s)] = 1;
    if (GSget(static_cast<GSObject>(s)).readhdr(path) != 0) exists_[static_cast<std::size_t>(s)] = 0;
  }
  if (GSexists(kGSSamplingConstants) && GSexists(kGSOrbit)) orbit.setLambda(sampling.lambda_m);
  return 0;
}

int GeneralSAR::GSwrite(const std::string& path) {
  base::Frame frame("GeneralSAR::GSwrite");
  for (int s = kGSObjects - 1; s >= 0; --s) {
    if (!exists_[static_cast<std::size_t>(s)]) continue;
    if (int st = GSget(static_cast<GSObject>(s)).writehdr(path); st != 0) {
      base::report(base::kReportErrorCallTree, "Called function returned ERROR");
      return st;
    }
  }
  return 0;
}

int GeneralSAR::GSclone(const GeneralSAR& other) {
  exists_ = other.exists_;
  int st = 0;
  st |= dataFile.clone(other.dataFile);
  roi = other.roi;
  st |= polys.clone(other.polys);
  st |= sampling.clone(other.sampling);
  st |= stateVectors.clone(other.stateVectors);
  st |= orbit.clone(other.orbit);
  st |= pulse.clone(other.pulse);
  st |= pattern.clone(other.pattern);
  st |= info.clone(other.info);
  st |= attitude.clone(other.attitude);
  st |= windows.clone(other.windows);
  st |= corners.clone(other.corners);
  st |= swath.clone(other.swath);
  st |= buffer.clone(other.buffer);
  return st != 0 ? 1 : 0;
}

int GeneralRAWData::readhdr(const std::string& raster) {
  return read_fixed(*this, raster, kRawSlots, "GeneralRAWData::readhdr");
}

int GeneralRAWData::writehdr(const std::string& raster) { return write_fixed(*this, raster, kRawSlots); }

int GeneralSLCData::readhdr(const std::string& raster) {
  return read_fixed(*this, raster, kSlcSlots, "GeneralSLCData::readhdr");
}

int GeneralSLCData::writehdr(const std::string& raster) { return write_fixed(*this, raster, kSlcSlots); }

}  // namespace sar::io
