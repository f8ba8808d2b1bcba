#include "jobs/batch.hpp"

#include <algorithm>
#include <atomic>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <mutex>
#include <sstream>
#include <thread>

#include "base/command_line.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {

std::string trim(const std::string& s) {
  const auto b = s.find_first_not_of(" \t\r");
  if (b == std::string::npos) return {};
  return s.substr(b, s.find_last_not_of(" \t\r") - b + 1);
}

std::string format_seconds(double s) {
  char buf[32];
  std::snprintf(buf, sizeof buf, "%.1f s", s);
  return buf;
}

const char* status_word(StandaloneResult r) {
  switch (r) {
    case StandaloneResult::kDone: return "done";
    case StandaloneResult::kSkipped: return "skipped";
    case StandaloneResult::kNotBuilt: return "not built";
    case StandaloneResult::kFailed:
    case StandaloneResult::kBadRequest: break;
  }
  return "FAILED";
}

bool succeeded(StandaloneResult r) { return r == StandaloneResult::kDone || r == StandaloneResult::kSkipped; }

// What the output column shows: the SLC (or the first product), else the error and the log.
std::string output_column(const StandaloneOutcome& o) {
  if (succeeded(o.result)) {
    if (!o.slc.empty()) return o.slc;
    return o.products.empty() ? std::string("-") : o.products.front();
  }
  std::string text = o.error.empty() ? o.summary : o.error;
  if (o.result == StandaloneResult::kFailed && !o.workDir.empty())
    text += "; log: " + (fs::path(o.workDir) / "Vanterra.log").string();
  return text;
}

bool starts_with_product_header(const fs::path& p) {
  std::ifstream in(p, std::ios::binary);
  char head[8] = {};
  in.read(head, sizeof head);
  return in.gcount() == 8 && std::string_view(head, 8) == "PRODUCT=";
}

// A request whose paths no longer depend on the directory it is run from.
StandaloneRequest absolute_paths(StandaloneRequest r) {
  auto abs = [](std::string& p) {
    if (!p.empty()) p = fs::absolute(p).lexically_normal().string();
  };
  abs(r.orbit);
  abs(r.auxDir);
  abs(r.outDir);
  abs(r.paramsFile);
  return r;
}

int default_threads(int jobs) {
  const int cores = static_cast<int>(std::max(1u, std::thread::hardware_concurrency()));
  return std::max(1, cores / std::max(1, jobs));
}

// The command of every task, with "{product}" standing for the product and the threads left to
// the caller when `threadsWord` is given.
std::string task_command(const BatchRequest& req, const std::string& sarfocusExe, const std::string& productWord,
                         const std::string& threadsWord) {
  StandaloneRequest r = absolute_paths(req.common);
  r.skipComplete = !req.force;
  if (!threadsWord.empty()) r.threads = 0;
  std::vector<std::string> words{shell_quote(sarfocusExe), shell_quote(r.mode), productWord};
  for (const auto& o : standalone_options(r)) words.push_back(shell_quote(o));
  if (!threadsWord.empty()) {
    words.emplace_back("--threads");
    words.push_back(threadsWord);
  }
  std::string cmd;
  for (const auto& w : words) {
    if (!cmd.empty()) cmd.push_back(' ');
    cmd.append(w);
  }
  return cmd;
}

// sbatch reads the words of an #SBATCH line as a shell would: a path with blanks is quoted.
std::string sbatch_word(const std::string& w) {
  return w.find_first_of(" \t") == std::string::npos ? w : "\"" + w + "\"";
}

}  // namespace

std::string shell_quote(const std::string& word) {
  const bool plain = !word.empty() && std::all_of(word.begin(), word.end(), [](unsigned char c) {
    return std::isalnum(c) || std::string_view("/._-+=:,@%").find(static_cast<char>(c)) != std::string_view::npos;
  });
  if (plain) return word;
  std::string q = "'";
  for (char c : word) {
    if (c == '\'') q += "'\\''";
    else q += c;
  }
  return q + "'";
}

std::vector<std::string> batch_products(const std::string& source, std::string& error) {
  std::vector<std::string> out;
  std::error_code ec;
  if (source.empty()) {
    error = "no product list or folder given";
  } else if (fs::is_directory(source, ec)) {
    for (const auto& e : fs::directory_iterator(source, ec)) {
      std::string ext = e.path().extension().string();
      std::transform(ext.begin(), ext.end(), ext.begin(), [](unsigned char c) { return std::toupper(c); });
      if (ext == ".N1" && e.is_regular_file()) out.push_back(fs::absolute(e.path()).lexically_normal().string());
    }
    std::sort(out.begin(), out.end());
    if (out.empty()) error = "no *.N1 products in " + source;
  } else if (fs::is_regular_file(source, ec)) {
    if (starts_with_product_header(source)) {
      error = source + " is a product, not a list of products (sarfocus MODE PRODUCT runs one)";
      return {};
    }
    const fs::path base = fs::absolute(source).parent_path();
    std::ifstream in(source);
    for (std::string line; std::getline(in, line);) {
      const std::string t = trim(line);
      if (t.empty() || t.front() == '#') continue;
      const fs::path p(t);
      out.push_back((p.is_absolute() ? p : base / p).lexically_normal().string());
    }
    if (out.empty()) error = "no products listed in " + source;
  } else {
    error = "product list or folder not found: " + source;
  }
  return out;
}

StandaloneRequest product_request(const BatchRequest& request, const std::string& product) {
  StandaloneRequest r = request.common;
  r.product = product;
  r.skipComplete = !request.force;
  if (r.threads <= 0) r.threads = default_threads(request.jobs);
  return r;
}

std::vector<BatchItem> run_batch(const BatchRequest& request, const std::vector<std::string>& products,
                                 const std::string& focussingExe, std::FILE* progress) {
  std::vector<BatchItem> items(products.size());
  // Two products of one name would share a working directory and their outputs.
  std::map<std::string, std::size_t> byStem;
  std::vector<bool> runnable(products.size(), true);
  for (std::size_t i = 0; i < products.size(); ++i) {
    items[i].product = products[i];
    const auto [at, fresh] = byStem.emplace(product_stem(products[i]), i);
    if (fresh) continue;
    runnable[i] = false;
    auto& o = items[i].outcome;
    o.result = StandaloneResult::kBadRequest;
    o.status = kExitBadRequest;
    o.error = "same product name as " + products[at->second] + ": their outputs would collide";
    o.summary = "sarfocus: " + o.error;
  }

  std::atomic<std::size_t> next{0};
  std::size_t finished = 0;
  std::mutex reportLock;
  auto worker = [&]() {
    for (std::size_t i = next++; i < products.size(); i = next++) {
      if (runnable[i]) {
        try {
          items[i].outcome = run_standalone(product_request(request, products[i]), focussingExe, nullptr);
        } catch (const std::exception& e) {
          auto& o = items[i].outcome;
          o.result = StandaloneResult::kFailed;
          o.status = 1;
          o.error = e.what();
          o.summary = "sarfocus: FAILED: " + o.error;
        }
      }
      std::lock_guard<std::mutex> lock(reportLock);
      ++finished;
      if (progress) {
        const auto& o = items[i].outcome;
        std::fprintf(progress, "sarfocus: [%zu/%zu] %s: %s", finished, products.size(),
                     fs::path(products[i]).filename().c_str(), status_word(o.result));
        if (o.result == StandaloneResult::kDone) std::fprintf(progress, " in %s", format_seconds(o.seconds).c_str());
        if (!succeeded(o.result)) std::fprintf(progress, ": %s", o.error.c_str());
        std::fprintf(progress, "\n");
        std::fflush(progress);
      }
    }
  };
  const std::size_t workers = std::min<std::size_t>(static_cast<std::size_t>(std::max(1, request.jobs)),
                                                    std::max<std::size_t>(1, products.size()));
  std::vector<std::thread> pool;
  for (std::size_t w = 1; w < workers; ++w) pool.emplace_back(worker);
  worker();
  for (auto& t : pool) t.join();
  return items;
}

std::string batch_summary(const std::vector<BatchItem>& items) {
  std::size_t width = 7;
  for (const auto& it : items) width = std::max(width, fs::path(it.product).filename().string().size());
  auto row = [&](const std::string& a, const std::string& b, const std::string& c, const std::string& d) {
    std::string line = a;
    line.resize(width + 2, ' ');
    line += b;
    line.resize(width + 2 + 11, ' ');
    line += c;
    line.resize(width + 2 + 11 + 10, ' ');
    return line + d + "\n";
  };
  std::string out = row("PRODUCT", "STATUS", "TIME", "OUTPUT");
  int done = 0, skipped = 0, failed = 0;
  for (const auto& it : items) {
    const auto& o = it.outcome;
    const bool ran = o.result == StandaloneResult::kDone || o.result == StandaloneResult::kFailed ||
                     o.result == StandaloneResult::kNotBuilt;
    out += row(fs::path(it.product).filename().string(), status_word(o.result), ran ? format_seconds(o.seconds) : "-",
               output_column(o));
    (o.result == StandaloneResult::kDone ? done : o.result == StandaloneResult::kSkipped ? skipped : failed)++;
  }
  char tail[128];
  std::snprintf(tail, sizeof tail, "%zu products: %d done, %d skipped as complete, %d failed\n", items.size(), done,
                skipped, failed);
  return out + tail;
}

int batch_status(const std::vector<BatchItem>& items) {
  for (const auto& it : items)
    if (!succeeded(it.outcome.result)) return 1;
  return 0;
}

std::string emit_slurm(const BatchRequest& request, const std::vector<std::string>& products,
                       const std::string& sarfocusExe) {
  const std::string out = fs::absolute(request.common.outDir).lexically_normal().string();
  const bool threadsGiven = request.common.threads > 0;
  std::ostringstream s;
  s << "#!/bin/bash\n"
    << "# Slurm array job written by `sarfocus batch --emit slurm`: one array task a product, each\n"
    << "# focused by `sarfocus " << request.common.mode << " PRODUCT` in its working directory "
    << (fs::path(out) / ".sarfocus" / "<product>").string() << "/.\n"
    << "# Submit with: sbatch THIS_FILE. "
    << (request.force ? "Every task runs its product again.\n"
                      : "A task whose product is complete ends at once, so the script can be\n"
                        "# submitted again to redo only the products that did not succeed.\n")
    << "#SBATCH --job-name=" << request.jobName << "\n"
    << "#SBATCH --array=0-" << (products.empty() ? 0 : products.size() - 1);
  if (request.jobs > 0) s << "%" << request.jobs;
  s << "\n#SBATCH --ntasks=1\n"
    << "#SBATCH --cpus-per-task=" << (threadsGiven ? request.common.threads : 1) << "\n"
    << "#SBATCH --output=" << sbatch_word((fs::path(out) / ".sarfocus" / "slurm-%A_%a.out").string()) << "\n";
  for (const auto& o : request.slurmOptions) s << "#SBATCH " << o << "\n";
  s << "set -u\n"
    << "case \"${SLURM_ARRAY_TASK_ID:?run this script with sbatch}\" in\n";
  for (std::size_t i = 0; i < products.size(); ++i)
    s << "  " << i << ") product=" << shell_quote(products[i]) << " ;;\n";
  s << "  *) echo \"sarfocus: no product for array task ${SLURM_ARRAY_TASK_ID}\" >&2; exit 2 ;;\n"
    << "esac\n"
    << "exec "
    << task_command(request, sarfocusExe, "\"$product\"", threadsGiven ? "" : "\"${SLURM_CPUS_PER_TASK:-1}\"")
    << "\n";
  return s.str();
}

std::string emit_parallel(const BatchRequest& request, const std::vector<std::string>& products,
                          const std::string& sarfocusExe) {
  BatchRequest r = request;
  if (r.common.threads <= 0 && r.jobs > 0 && r.sshLogins.empty()) r.common.threads = default_threads(r.jobs);
  const fs::path out = fs::absolute(r.common.outDir).lexically_normal();
  // -q quotes every word of the command again for the shell that parallel starts, so paths
  // with blanks survive, also over ssh.
  std::string line = "parallel -q --will-cite";
  auto word = [&line](const std::string& w) {
    line.push_back(' ');
    line.append(w);
  };
  if (r.jobs > 0) {
    word("--jobs");
    word(std::to_string(r.jobs));
  }
  word("--joblog");
  word(shell_quote((out / ".sarfocus" / "parallel.joblog").string()));
  for (const auto& login : r.sshLogins) {
    word("--sshlogin");
    word(shell_quote(login));
  }
  word(task_command(r, sarfocusExe, "{}", ""));
  word(":::");
  for (const auto& p : products) word(shell_quote(p));
  line.push_back('\n');
  return line;
}

namespace {

// An option of the emitted script or command: a value on one line.
CLI::Validator one_line() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        return text.find('\n') == std::string::npos ? std::string() : std::string("takes one line");
      },
      "TEXT");
}

const char* kBatchUsage =
    "sarfocus batch LIST|DIR [--mode MODE] [--jobs N] [--force] [MODE options]\n"
    "       sarfocus batch LIST|DIR --emit slurm [--slurm-option TEXT]... [--job-name NAME] [options]\n"
    "       sarfocus batch LIST|DIR --emit parallel [--sshlogin LOGIN]... [options]";

const char* kBatchText =
    "\n"
    "Focus many products, each in its own working directory OUT/.sarfocus/<product>/, as\n"
    "`sarfocus MODE PRODUCT` would. LIST is a text file of product paths, one a line (blank lines\n"
    "and lines starting with # are skipped; relative paths are taken from the list's folder);\n"
    "DIR gives its *.N1 files. A failed product never stops the others. The MODE options are those\n"
    "of sarfocus im --help; --threads defaults to the cores divided by --jobs.\n";

const char* kBatchFooter =
    "A local run ends with a table of product, status, time and output (the SLC, or the error\n"
    "text). A product counts as complete, and is skipped on the next run, when its marker\n"
    "OUT/.sarfocus/<product>/sarfocus.complete stands (written last by a successful run) and the\n"
    "SLC, its _slc_hdr annotation and, when asked for, the quick-look are there with the sizes it\n"
    "records. Exit status: 0 when every product is done or skipped, 1 when any failed, 2 for a\n"
    "bad command line or inputs.\n";

struct BatchWords {
  std::string emit;
  bool jobsGiven = false;
};

std::unique_ptr<CLI::App> batch_app(BatchRequest& req, BatchWords& words) {
  using base::cli::shown_as;
  auto app = base::cli::make_app("sarfocus batch", kBatchUsage, kBatchText);
  shown_as(app->add_option("LIST", req.source, "a list file of products, or a folder of them"), "LIST|DIR");
  shown_as(app->add_option("--mode", req.common.mode, "im (default), ap, ws, rs or wss")->check(one_line()), "MODE");
  shown_as(app->add_option_function<int>(
                   "-j,--jobs",
                   [&](int n) {
                     req.jobs = n;
                     words.jobsGiven = true;
                   },
                   "products run at a time (default 1); with --emit slurm the array's\n"
                   "throttle, with --emit parallel the jobs a host")
               ->check(base::cli::whole_number(1, 4096)),
           "N");
  app->add_flag("--force", req.force, "run products again whose outputs are complete");
  shown_as(app->add_option("--emit", words.emit,
                           "print instead of running: with --emit slurm a Slurm array job script,\n"
                           "one array task a product, each running `sarfocus MODE PRODUCT ...\n"
                           "--skip-complete` (submit it with sbatch; task logs go to\n"
                           "OUT/.sarfocus/slurm-*.out); with --emit parallel a GNU parallel\n"
                           "command line")
               ->check(base::cli::one_of({"slurm", "parallel"})),
           "slurm|parallel");
  shown_as(app->add_option("--slurm-option", req.slurmOptions,
                           "an #SBATCH line of the script, e.g. --slurm-option --partition=short")
               ->check(one_line())
               ->allow_extra_args(false),
           "TEXT");
  shown_as(app->add_option("--job-name", req.jobName, "the Slurm job name (default sarfocus)")->check(one_line()),
           "NAME");
  shown_as(app->add_option("--sshlogin", req.sshLogins,
                           "spread the parallel jobs over hosts (GNU parallel's --sshlogin, e.g.\n"
                           "4/node1,4/node2,: where : is this machine); the paths must be the same\n"
                           "on every host")
               ->check(one_line())
               ->allow_extra_args(false),
           "LOGIN");
  // A batch skips complete products anyway (unless --force): --skip-complete is accepted.
  add_standalone_options(*app, req.common);
  app->footer(kBatchFooter);
  return app;
}

}  // namespace

std::string batch_help() {
  BatchRequest unused;
  BatchWords words;
  return batch_app(unused, words)->help();
}

int batch_main(const std::vector<std::string>& args, std::size_t first, const SarfocusTools& tools, std::FILE* out,
               std::FILE* err) {
  BatchRequest req;
  BatchWords words;
  const auto app = batch_app(req, words);
  const auto parsed = base::cli::parse(
      *app, std::vector<std::string>(args.begin() + static_cast<std::ptrdiff_t>(std::min(first, args.size())), args.end()));
  if (parsed.help) {
    std::fputs(batch_help().c_str(), out);
    return 0;
  }
  std::string error = parsed.error;
  if (error.empty() && !known_mode(req.common.mode))
    error = "unknown mode '" + req.common.mode + "' (im, ap, ws, rs or wss)";
  if (error.empty()) {
    if (words.emit == "slurm") req.emit = BatchEmit::kSlurm;
    else if (words.emit == "parallel") req.emit = BatchEmit::kParallel;
  }
  if (error.empty() && !req.sshLogins.empty() && req.emit != BatchEmit::kParallel)
    error = "--sshlogin goes with --emit parallel";
  if (error.empty() && (!req.slurmOptions.empty() || req.jobName != "sarfocus") && req.emit != BatchEmit::kSlurm)
    error = "--slurm-option and --job-name go with --emit slurm";
  if (error.empty() && req.source.empty()) error = "no product list or folder given";
  if (!error.empty()) {
    std::fprintf(err, "sarfocus batch: %s; see sarfocus batch --help\n", error.c_str());
    return kExitBadRequest;
  }
  const bool jobsGiven = words.jobsGiven;
  if (!jobsGiven && req.emit == BatchEmit::kRun) req.jobs = 1;

  // What every product shares is checked once, before anything runs.
  std::error_code ec;
  const auto& c = req.common;
  if (!c.orbit.empty() && !fs::exists(c.orbit, ec)) error = "orbit not found: " + c.orbit;
  else if (!c.auxDir.empty() && !fs::is_directory(c.auxDir, ec)) error = "auxiliary folder not found: " + c.auxDir;
  else if (!c.paramsFile.empty() && !fs::is_regular_file(c.paramsFile, ec))
    error = "parameter file not found: " + c.paramsFile;
  else error = output_dir_problem(c.outDir);
  std::vector<std::string> products;
  if (error.empty()) products = batch_products(req.source, error);
  if (!error.empty()) {
    std::fprintf(err, "sarfocus batch: %s\n", error.c_str());
    return kExitBadRequest;
  }

  if (req.emit != BatchEmit::kRun) {
    for (const auto& p : products)
      if (!fs::exists(p, ec)) std::fprintf(err, "sarfocus batch: warning: product not found here: %s\n", p.c_str());
    // The task logs and the job log need the folder before the first task starts.
    fs::create_directories(fs::path(fs::absolute(c.outDir)) / ".sarfocus", ec);
    if (ec) {
      std::fprintf(err, "sarfocus batch: cannot create %s: %s\n",
                   (fs::path(fs::absolute(c.outDir)) / ".sarfocus").c_str(), ec.message().c_str());
      return kExitBadRequest;
    }
    const std::string text = req.emit == BatchEmit::kSlurm ? emit_slurm(req, products, tools.sarfocus)
                                                           : emit_parallel(req, products, tools.sarfocus);
    std::fputs(text.c_str(), out);
    return 0;
  }
  const auto items = run_batch(req, products, tools.focussing, err);
  std::fputs(batch_summary(items).c_str(), out);
  return batch_status(items);
}

}  // namespace sar::jobs
