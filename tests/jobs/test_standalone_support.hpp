#pragma once
// What the sarfocus tests share: small simulated IM products that the IM job focuses end to
// end, the parameters that fit such small scenes, and sarfocus run in-process with its two
// output streams captured.
#include <cstdio>
#include <string>
#include <vector>

#include "job_harness.hpp"
#include "jobs/standalone.hpp"
#include "simulator/simulator.hpp"

namespace sar::test {

/// Blocks small enough for a 1200 x 1200 scene.
inline const std::vector<std::string> kSmallSceneParams = {
    "LinesInBlock=1024", "AzimuthOverlap=512", "SamplesInBlock=1024", "Azblk=1000", "Blocks=128", "Blockl=256"};

/// A 1200 x 1200 IM product of one target, with its orbit, ASA_INS and ASA_XCA, in `dir`.
inline simulator::SimulationTruth simulate_small(const fs::path& dir, const std::string& sceneTime) {
  simulator::SimulationConfig c;
  c.out_dir = dir.string();
  c.lines = 1200;
  c.samples = 1200;
  c.noise_db = -10.0;
  c.scene_time = sceneTime;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  return simulator::run_simulation(c);
}

inline jobs::SarfocusTools sarfocus_tools() {
  const fs::path focussing = SAR_FOCUSSING_EXE;
  return {focussing.string(), (focussing.parent_path() / "sarfocus").string()};
}

struct CliResult {
  int status = -1;
  std::string out, err;
};

inline std::string read_stream(std::FILE* f) {
  std::string text;
  std::rewind(f);
  char buf[4096];
  for (std::size_t n; (n = std::fread(buf, 1, sizeof buf, f)) > 0;) text.append(buf, n);
  std::fclose(f);
  return text;
}

/// `sarfocus ARGS...` in this process.
inline CliResult sarfocus(const std::vector<std::string>& args, const jobs::SarfocusTools& tools = sarfocus_tools()) {
  std::FILE* out = std::tmpfile();
  std::FILE* err = std::tmpfile();
  CliResult r;
  r.status = jobs::sarfocus_run(args, tools, out, err);
  r.out = read_stream(out);
  r.err = read_stream(err);
  return r;
}

/// A shell command's exit status and standard output.
inline CliResult shell(const std::string& command) {
  CliResult r;
  std::FILE* p = ::popen(command.c_str(), "r");
  if (!p) return r;
  char buf[4096];
  for (std::size_t n; (n = std::fread(buf, 1, sizeof buf, p)) > 0;) r.out.append(buf, n);
  const int raw = ::pclose(p);
  r.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
  return r;
}

inline std::size_t count_lines(const std::string& text) {
  std::size_t n = 0;
  for (char c : text) n += c == '\n';
  return n;
}

}  // namespace sar::test
