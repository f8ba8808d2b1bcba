// The entry as the host sees it: command strings and job lists in, error codes, exit statuses
// and the working file out.
#include <gtest/gtest.h>

#include <functional>

#include "job_harness.hpp"

using namespace sar::test;

namespace {

constexpr const char* kIm = "main_focussing_asar_IM#";

// Fourteen valid IM arguments over the real products, output into the job's directory.
std::vector<std::string> im_args(const ScratchJob& job) {
  return {kIm0, kVor, kIns, "NotOK", (job.dir() / "out").string(), "512", "512", "NotOK", "0", "0",
          "NotOK", "NotOK", "NotOK", "1.0"};
}

std::vector<std::string> with_header(std::vector<std::string> args) {
  args.insert(args.begin(), "list header line (dropped)");
  return args;
}

// The real IM products are cut inside their first packet: an IM job runs into the extraction,
// which stops with the file error naming the product. The record holds the name in lines of
// 48 characters; this marks the first of them as the expected detail.
constexpr const char* kProductHead = "(first 48 characters of the product path)";
constexpr int kFileIo = 1305606;
constexpr int kFileIoStatus = 20;

struct EntryCase {
  const char* name;
  // Builds the command string inside a laid-out job directory.
  std::function<std::string(ScratchJob&)> command;
  int ec;              // in the error file
  int status;          // process exit status
  const char* detail;  // first detail line of the error record, or null
  const char* inLog;   // text the log must hold, or null
};

std::string list_of(ScratchJob& job, std::vector<std::string> lines) {
  return job.write_list("list.txt", lines);
}

const EntryCase kCases[] = {
    {"im_stops_in_extraction_of_truncated_product",
     [](ScratchJob& j) { return kIm + list_of(j, with_header(im_args(j))); }, kFileIo, kFileIoStatus, kProductHead,
     "START : Focussing ASAR IM"},
    // The AP driver runs and refuses an image mode product as no AP product.
    {"ap_prefix_runs_ap_driver",
     [](ScratchJob& j) { return "main_focussing_asar_AP#" + list_of(j, with_header(im_args(j))); }, 456962, 7,
     "ASA_AP0", "START : Focussing ASAR AP"},
    // The WS job runs, and refuses the IM level 0 product it is given.
    {"ws_prefix", [](ScratchJob& j) { return "main_focussing_asar_WS#" + list_of(j, with_header(im_args(j))); },
     456962, 7, "ASA_WS0", "START : Focussing ASAR WS"},
    {"rs_prefix", [](ScratchJob& j) { return "main_focussing_asar_RS#" + list_of(j, with_header(im_args(j))); },
     130560, 2, "RADARExtract()", "START : Focussing ASAR RS"},
    // The WSS job runs, and refuses the IM level 0 product it is given.
    {"wss_prefix", [](ScratchJob& j) { return "main_multilook_WSS#" + list_of(j, with_header(im_args(j))); },
     456962, 7, "ASA_WSS", "START : Multilooking ASA WSS"},
    {"prefix_without_hash",
     [](ScratchJob& j) { return "main_focussing_asar_IM" + list_of(j, with_header(im_args(j))); }, 456963, 7,
     nullptr, nullptr},
    {"prefix_in_lower_case",
     [](ScratchJob& j) { return "main_focussing_asar_im#" + list_of(j, with_header(im_args(j))); }, 456963, 7,
     nullptr, nullptr},
    {"host_text_cut_at_separator",
     [](ScratchJob& j) { return kIm + list_of(j, with_header(im_args(j))) + "###Vanterra###host 12 x"; }, kFileIo,
     kFileIoStatus, kProductHead, nullptr},
    {"list_of_15_lines_is_enough", [](ScratchJob& j) { return kIm + list_of(j, with_header(im_args(j))); }, kFileIo,
     kFileIoStatus, nullptr, nullptr},
    {"list_of_14_lines_is_short",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a.pop_back();
       return kIm + list_of(j, with_header(a));
     },
     456962, 7, nullptr, " Parameter 12 (NotOK)"},
    {"hash_third_line_ends_list",
     [](ScratchJob& j) {
       auto a = with_header(im_args(j));
       a[2] = "#" + a[2];
       return kIm + list_of(j, a);
     },
     456962, 7, nullptr, " Parameter 0 ("},
    {"long_line_ends_reading",
     [](ScratchJob& j) {
       auto a = with_header(im_args(j));
       a[4] = std::string(300, 'x');
       return kIm + list_of(j, a);
     },
     456962, 7, nullptr, " Parameter 2 ("},
    {"list_found_in_working_dir_by_name",
     [](ScratchJob& j) {
       list_of(j, with_header(im_args(j)));
       return std::string(kIm) + "/nowhere/at/all/list.txt";
     },
     kFileIo, kFileIoStatus, kProductHead, nullptr},
    {"missing_list", [](ScratchJob&) { return std::string(kIm) + "/nowhere/missing_list.txt"; }, 261122, 4,
     "/nowhere/missing_list.txt", nullptr},
    {"one_line_list", [](ScratchJob& j) { return kIm + list_of(j, {"only the header"}); }, 261122, 4, nullptr,
     nullptr},
    {"product_not_given",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[0] = "NotOK";
       return kIm + list_of(j, with_header(a));
     },
     456962, 7, "ASA_IM0", nullptr},
    {"product_of_wrong_type",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[0] = kCon;
       return kIm + list_of(j, with_header(a));
     },
     456962, 7, "ASA_IM0", nullptr},
    {"product_missing",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[0] = "/nowhere/ASA_IM__0CNPDE_missing.N1";
       return kIm + list_of(j, with_header(a));
     },
     261122, 4, "/nowhere/ASA_IM__0CNPDE_missing.N1", nullptr},
    {"orbit_of_wrong_type",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[1] = kXca;
       return kIm + list_of(j, with_header(a));
     },
     456962, 7, "DOR_VOR", nullptr},
    {"orbit_not_given",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[1] = "NotOK";
       return kIm + list_of(j, with_header(a));
     },
     456962, 7, "DOR_VOR", nullptr},
    {"ins_lookup_fails_without_index",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[2] = "NotOK";
       fs::remove(j.dir() / "des" / "ASA_AUX_list.dat");
       return kIm + list_of(j, with_header(a));
     },
     130560, 2, "find_aux()", nullptr},
    {"ins_found_in_index",
     [](ScratchJob& j) {
       auto a = im_args(j);
       a[2] = "NotOK";
       return kIm + list_of(j, with_header(a));
     },
     kFileIo, kFileIoStatus, kProductHead, nullptr},
};

void PrintTo(const EntryCase& c, std::ostream* os) { *os << c.name; }

class Entry : public ::testing::TestWithParam<EntryCase> {};

TEST_P(Entry, EndsWithTheHostsCodeStatusAndRecord) {
  const EntryCase& c = GetParam();
  ScratchJob job(c.name);
  job.layout();
  const std::string command = c.command(job);
  const RunResult r = job.run(command);

  EXPECT_EQ(job.error_code(), c.ec) << r.err;
  EXPECT_EQ(r.status, c.status) << r.err;
  const auto record = job.error_lines();
  ASSERT_GE(record.size(), 3u);
  EXPECT_EQ(record[0], "-1");
  if (c.detail) {
    ASSERT_GE(record.size(), 4u);
    EXPECT_EQ(record[3], c.detail == std::string(kProductHead) ? kIm0.substr(0, 48) : std::string(c.detail));
  }
  // The working file carries the same record behind the failure mark.
  const auto working = job.working_lines();
  ASSERT_GE(working.size(), 4u);
  EXPECT_EQ(working[0], "-1");
  EXPECT_EQ(working[2], record[1]);
  EXPECT_EQ(working[3], record[2]);
  if (c.inLog) {
    EXPECT_NE(job.log().find(c.inLog), std::string::npos) << job.log();
  }
  // A failed job never leaves a product behind.
  EXPECT_FALSE(fs::exists(job.dir() / "out_slc"));
}

INSTANTIATE_TEST_SUITE_P(CommandsAndLists, Entry, ::testing::ValuesIn(kCases),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
