#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <stdexcept>
#include <string>

#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "base/errors.hpp"

using namespace sar::base;

namespace {

// Each test starts from a fresh tracking table with the checked layer on.
class Diagnostics : public ::testing::Test {
 protected:
  void SetUp() override {
    exit_ckerr();
    init_ckerr_locking();
  }
  void TearDown() override {
    freeall_ckerr();
    exit_ckerr();
  }
};

int callee_that_fails(void** a, void** b) {
  Frame frame("callee");
  *a = malloc_ckerr(64);
  *b = calloc_ckerr(4, 16);
  return frame.check(10);
}

int caller(void** mine, void** a, void** b) {
  Frame frame("caller()");
  *mine = malloc_ckerr(32);
  if (int st = frame.check(callee_that_fails(a, b))) return st;
  return 0;
}

}  // namespace

TEST_F(Diagnostics, FailingCalleeFreesOwnBuffersAndCallerFreesLater) {
  void *mine = nullptr, *a = nullptr, *b = nullptr;
  Frame top("top");  // depth 1
  EXPECT_EQ(caller(&mine, &a, &b), 10);
  // The callee (depth 3) took its two buffers back; the caller frame freed its own one on the
  // failing check because it shares the caller invocation coordinate.
  EXPECT_EQ(ckerr_buffer_count(), 0);

  // A buffer of the enclosing frame survives a freeall run inside a deeper, later invocation.
  void* outer = malloc_ckerr(8);
  {
    Frame inner("inner");
    void* innerBuf = malloc_ckerr(8);
    ASSERT_NE(innerBuf, nullptr);
    EXPECT_EQ(ckerr_buffer_count(), 2);
    freeall_ckerr();
    EXPECT_EQ(ckerr_buffer_count(), 1);
  }
  free_ckerr(outer);
  EXPECT_EQ(ckerr_buffer_count(), 0);
}

TEST_F(Diagnostics, FreeOfNullOrForeignPointerHasNoEffect) {
  void* p = malloc_ckerr(16);
  int local = 0;
  free_ckerr(nullptr);
  free_ckerr(&local);
  EXPECT_EQ(ckerr_buffer_count(), 1);
  free_ckerr(p);
  EXPECT_EQ(ckerr_buffer_count(), 0);
}

TEST_F(Diagnostics, TableKeepsTheRightEntriesWhenFreedOutOfOrder) {
  void* p[5];
  for (auto& q : p) q = malloc_ckerr(8);
  free_ckerr(p[1]);
  free_ckerr(p[4]);  // the last entry
  free_ckerr(p[1]);  // already gone: ignored
  EXPECT_EQ(ckerr_buffer_count(), 3);
  for (int i : {0, 2, 3}) free_ckerr(p[i]);
  EXPECT_EQ(ckerr_buffer_count(), 0);
}

TEST_F(Diagnostics, CheckedBufferIsNotFreedTwiceAfterFreeall) {
  Frame f("owner");
  CheckedBuffer<float> buf(100);
  ASSERT_TRUE(buf);
  EXPECT_EQ(buf.size(), 100u);
  EXPECT_EQ(buf[99], 0.0f);  // zeroed
  freeall_ckerr();
  EXPECT_EQ(ckerr_buffer_count(), 0);
  // A new allocation may reuse the address; the old owner must not free it.
  void* fresh = malloc_ckerr(100 * sizeof(float));
  buf.reset();
  EXPECT_EQ(ckerr_buffer_count(), 1);
  free_ckerr(fresh);
}

TEST_F(Diagnostics, MatrixAllocationTracksRowsAndArray) {
  void** m = matalloc_ckerr(3, 24);
  ASSERT_NE(m, nullptr);
  EXPECT_EQ(ckerr_buffer_count(), 4);
  matfree_ckerr(m, 3);
  EXPECT_EQ(ckerr_buffer_count(), 0);
  void** none = matalloc_ckerr(0, 24);
  EXPECT_EQ(ckerr_buffer_count(), 1);
  free_ckerr(none);
}

TEST_F(Diagnostics, DepthFollowsFramesAndDeccurdepAloneGoesNegativeWhenOff) {
  const int d0 = current_depth();
  {
    Frame a("a");
    EXPECT_EQ(current_depth(), d0 + 1);
    {
      Frame b("b");
      EXPECT_EQ(current_depth(), d0 + 2);
    }
    EXPECT_EQ(current_depth(), d0 + 1);
  }
  EXPECT_EQ(current_depth(), d0);
  exit_ckerr();  // checking off
  set_ckerr_fun("ignored");
  deccurdep();
  EXPECT_EQ(current_depth(), -1);
}

TEST_F(Diagnostics, FatalReportLevelsRaiseTheirCodes) {
  set_flg_report(1);
  struct Case {
    int level;
    int32_t ec;
  };
  for (Case c : {Case{7, 1305601}, Case{8, 1305604}, Case{9, 1305602}, Case{10, 1305603}, Case{11, 1370882},
                 Case{12, 1370883}, Case{13, 1305605}, Case{19, 1370881}, Case{20, 1370884}, Case{21, 1305606}}) {
    try {
      omb_add_report("input gone", c.level, 12, "unit", "unit");
      ADD_FAILURE() << "level " << c.level << " did not end the run";
    } catch (const CErrorExceptionManager& e) {
      EXPECT_EQ(e.ec(), c.ec) << "level " << c.level;
      EXPECT_EQ(e.detail(), "input gone");
      EXPECT_EQ(e.source_file(), std::string(kCheckerrUnit));
    }
  }
  const int before = report_count();
  for (int level : {0, 1, 2, 3, 4, 5, 6, 14, 18, 22})
    EXPECT_NO_THROW(omb_add_report("x", level, 1, "f", "f")) << level;
  EXPECT_EQ(report_count(), before + 10);
  set_flg_report(0);
  EXPECT_NO_THROW(omb_add_report("x", 7, 1, "f", "f"));  // reports off: nothing happens
}

TEST(ErrorCodes, ArithmeticAndExitStatus) {
  struct Case {
    int32_t ec, pec, sec, status;
  };
  for (Case c : {Case{0, 0, -1, 0}, Case{65280, 1, -1, 0}, Case{130560, 2, -1, 2}, Case{261122, 4, 1, 4},
                 Case{326400, 5, -1, 5}, Case{456962, 7, 1, 7}, Case{456963, 7, 2, 7}, Case{783360, 12, -1, 12},
                 Case{913920, 14, -1, 14}, Case{1305606, 20, 5, 20}, Case{1370884, 21, 3, 21}}) {
    EXPECT_EQ(pec_of(c.ec), c.pec) << c.ec;
    if (c.ec != 0) {
      EXPECT_EQ(sec_of(c.ec), c.sec) << c.ec;
      EXPECT_EQ(make_ec(c.pec, c.sec), c.ec);
    }
    EXPECT_EQ(process_status_for(c.ec), c.status) << c.ec;
  }
}

// An exception thrown inside a parallel region comes out after it, the first one thrown, and
// once a body has failed the remaining bodies are skipped; with no failure nothing is thrown.
TEST(ParallelFailure, CarriesTheFirstExceptionOutOfTheRegion) {
  for (const int failing : {-1, 0, 37, 999}) {
    sar::base::ParallelFailure failure;
    std::atomic<int> ran{0};
#pragma omp parallel for schedule(static, 1)
    for (int i = 0; i < 1000; ++i)
      failure.run([&] {
        ++ran;
        if (i == failing) throw std::runtime_error("body " + std::to_string(i));
      });
    if (failing < 0) {
      EXPECT_NO_THROW(failure.rethrow());
      EXPECT_EQ(ran.load(), 1000);
      continue;
    }
    EXPECT_TRUE(failure.failed());
    try {
      failure.rethrow();
      ADD_FAILURE() << "nothing rethrown";
    } catch (const std::runtime_error& e) {
      EXPECT_EQ(std::string(e.what()), "body " + std::to_string(failing));
    }
    EXPECT_LE(ran.load(), 1000);
  }
}
