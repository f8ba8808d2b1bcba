#pragma once
// Many products through sarfocus: run side by side on this machine, or written out as a Slurm
// array job or a GNU parallel command line whose every task is one `sarfocus MODE PRODUCT` run.
// All three forms share the working-directory layout of a single run (standalone.hpp), so a
// product done by one form counts as done for the others.
#include <cstdio>
#include <string>
#include <vector>

#include "jobs/standalone.hpp"

namespace sar::jobs {

enum class BatchEmit { kRun, kSlurm, kParallel };

struct BatchRequest {
  std::string source;           // list file or folder of products
  StandaloneRequest common;     // mode and options of every product (its product is ignored)
  int jobs = 0;                 // products at a time; 0: not given
  bool force = false;           // run again products whose outputs are complete
  BatchEmit emit = BatchEmit::kRun;
  std::vector<std::string> sshLogins;     // GNU parallel's --sshlogin values
  std::vector<std::string> slurmOptions;  // extra #SBATCH options
  std::string jobName = "sarfocus";
};

/// Products named by a list file (one path a line; blank lines and lines starting with '#'
/// skipped; relative paths from the list's folder) or a folder (its *.N1 files, by name), as
/// absolute paths. Empty with `error` set when there are none or the source is unusable.
std::vector<std::string> batch_products(const std::string& source, std::string& error);

struct BatchItem {
  std::string product;
  StandaloneOutcome outcome;
};

/// The request of one product of a batch: the common options, completeness checked unless
/// forced, and the threads shared out when not given.
StandaloneRequest product_request(const BatchRequest& request, const std::string& product);

/// Run the products, `request.jobs` (at least 1) at a time, each in its own working directory.
/// A failed product never stops the others. `progress` receives a line as each one ends (null
/// for none). The items come back in the order of `products`.
std::vector<BatchItem> run_batch(const BatchRequest& request, const std::vector<std::string>& products,
                                 const std::string& focussingExe, std::FILE* progress);

/// The summary table (product, status, time, output or error text) and a count line.
std::string batch_summary(const std::vector<BatchItem>& items);

/// Exit status of a batch run: 0 when every product is done or skipped, else 1.
int batch_status(const std::vector<BatchItem>& items);

/// A Slurm array job script: one array task a product, each running `sarfocusExe MODE
/// PRODUCT ... --skip-complete` (unless forced) with its log in OUT/.sarfocus/.
std::string emit_slurm(const BatchRequest& request, const std::vector<std::string>& products,
                       const std::string& sarfocusExe);

/// A GNU parallel command line running the same `sarfocus MODE PRODUCT` commands.
std::string emit_parallel(const BatchRequest& request, const std::vector<std::string>& products,
                          const std::string& sarfocusExe);

/// A word for a POSIX shell: single-quoted unless it needs no quoting.
std::string shell_quote(const std::string& word);

/// The help text of `sarfocus batch`.
std::string batch_help();

/// `sarfocus batch LIST|DIR [options]`, args[first] on.
int batch_main(const std::vector<std::string>& args, std::size_t first, const SarfocusTools& tools, std::FILE* out,
               std::FILE* err);

}  // namespace sar::jobs
