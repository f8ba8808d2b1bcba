#pragma once
// The ENVISAT stripmap jobs, image mode (one image) and alternating polarisation (two images,
// one per polarisation), on the shared job skeleton: the inputs are resolved and checked, the
// parameters read once per image, the level 0 product extracted once for all images, then each
// image runs through the stripmap chain and gets its annotation, raster header, description
// and footprint; the quick-looks come last.
//
// The images run one after the other, each freeing its buffers before the next starts, so a
// two-image job needs the memory of one.
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "hostlib/quicklook.hpp"
#include "base/errors.hpp"
#include "jobs/annotation.hpp"
#include "jobs/stage_chain.hpp"
#include "jobs/stages.hpp"

namespace sar::jobs {

/// One image of a stripmap job and the records it goes through the chain with.
struct StripmapChannel {
  sarpar par;
  procparm proc;
  dcestconf dc;
  azimuthconf az;
  std::string word;  // polarisation word of the output name ("hv"); empty for the IM image
  // The quick-look's sums, taken while the focused image is in memory (empty otherwise: the
  // quick-look then reads the SLC back).
  hostlib::QuickLookGrid quicklook;
};

/// What tells the IM and AP jobs apart.
struct StripmapJobKind {
  std::string_view title;            // "Focussing ASAR IM"
  std::string_view banner;           // start banner, %s from arguments 0 to 4
  std::string_view productDetail;    // error detail of a product of the wrong type: "ASA_IM0"
  std::string_view parameterFile;    // "parameters_IM.hdr"
  std::string_view readparsDetail;   // "IMreadpars_kelvor()"
  std::string_view processorDetail;  // "IMprocessor()"
  std::string_view writeparsDetail;  // "IMwritepars_kelvor()"
  std::string_view writeparsStage;   // "IMwritepars"
  bool polWeightsRequired = true;    // AP parameter files have none: all terms are fitted
  bool checkAuxTypes = false;        // given ASA_XCA and ASA_INS must be of their types
  AnnotationProduct annotation;
  /// The images of a product in output order: their polarisation words (one empty word for
  /// IM). Raises the bad-argument code with `productDetail` for a product of another type.
  std::function<std::vector<std::string>(const std::string& level0Path)> images;
  /// Activity label of each image's quick-look.
  std::vector<std::string_view> quicklookLabels;
};

/// Runs the job of `kind` on the list at `listPath`. Returns 0; failures end the job through
/// the fatal exit with the codes of the stripmap jobs.
int run_stripmap_job(const std::string& listPath, const StripmapJobKind& kind);

/// Reads sections "GeneralProcessingConf", "DCestConf" and "AzimuthConf" into one image's
/// records. Every key but `Report_level` is mandatory, and `Pol_Weights` when
/// `polWeightsRequired`; without it every term of the centroid surface is fitted. A missing
/// key ends the run with status 1.
int read_stripmap_parameters(const std::string& parameterFile, StripmapChannel& channel, StageFlags& flags,
                             bool polWeightsRequired);

/// The quick-look the job list asks for (argument 12 "OK"; brightness and size).
struct QuickLookOptions {
  bool wanted = false;
  double scale = 1.0;
  int width = 0, height = 0;
};

/// The stages one image of an ENVISAT stripmap product runs through after the extraction,
/// for the stage flags and the product's auxiliary files.
StageChain<StripmapChannel> stripmap_chain(const StageFlags& flags, const enviauxfiles& files, bool incore,
                                           const QuickLookOptions& quicklook = {});

/// GeoTIFF quick-look of a focused SLC (focused sizes and corners from `proc`): from `sums`
/// when they were taken of this image in memory, else from the SLC file. 0, or the writer's
/// status with the failed stage noted.
int write_quicklook(const std::string& slcPath, const std::string& tifPath, double scale, int width, int height,
                    const procparm& proc, const hostlib::QuickLookGrid* sums = nullptr);
/// An input error thrown while a channel is processed, into the host's error record: an orbit
/// that does not reach over the channel's lines is a stage that cannot run (130560, with the
/// scene's times and the file's span); any other fault keeps the code its reader gave it.
[[noreturn]] void fail_on_input(const base::InputError& e, const std::string& processorDetail, const sarpar& par);

/// Directory part of a path: up to the last '/' or '\', "." when there is none.
std::string directory_of(const std::string& path);

}  // namespace sar::jobs
