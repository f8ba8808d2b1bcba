#pragma once
// Vectors and matrices with arbitrary index bounds, for the numerical routines that are
// written with 1-based indexing. They own their storage (no pointer arithmetic outside the
// array): v[i] is valid for lo() <= i <= hi().
#include <cassert>
#include <cstddef>
#include <span>
#include <vector>

namespace sar::dsp {

template <class T>
class NrVector {
 public:
  NrVector() = default;
  /// Elements lo..hi; empty when hi < lo.
  NrVector(long lo, long hi) : lo_(lo), data_(hi >= lo ? static_cast<std::size_t>(hi - lo + 1) : 0) {}

  T& operator[](long i) {
    assert(i >= lo_ && i <= hi());
    return data_[static_cast<std::size_t>(i - lo_)];
  }
  const T& operator[](long i) const {
    assert(i >= lo_ && i <= hi());
    return data_[static_cast<std::size_t>(i - lo_)];
  }
  long lo() const { return lo_; }
  long hi() const { return lo_ + static_cast<long>(data_.size()) - 1; }
  std::size_t size() const { return data_.size(); }
  bool covers(long first, long last) const { return first >= lo_ && last <= hi(); }
  std::span<T> values() { return data_; }
  std::span<const T> values() const { return data_; }
  void reset() {
    data_.clear();
    data_.shrink_to_fit();
  }

 private:
  long lo_ = 1;
  std::vector<T> data_;
};

template <class T>
class NrMatrix {
 public:
  NrMatrix() = default;
  /// Rows rlo..rhi, columns clo..chi, stored row after row.
  NrMatrix(long rlo, long rhi, long clo, long chi)
      : rlo_(rlo),
        clo_(clo),
        rows_(rhi >= rlo ? rhi - rlo + 1 : 0),
        cols_(chi >= clo ? chi - clo + 1 : 0),
        data_(static_cast<std::size_t>(rows_ * cols_)) {}

  T& operator()(long i, long j) { return data_[index(i, j)]; }
  const T& operator()(long i, long j) const { return data_[index(i, j)]; }

  /// m[i][j] as in the 1-based C form.
  class Row {
   public:
    Row(T* base, long clo) : base_(base), clo_(clo) {}
    T& operator[](long j) const { return base_[j - clo_]; }

   private:
    T* base_;
    long clo_;
  };
  Row operator[](long i) { return Row(data_.data() + index(i, clo_), clo_); }

  long rlo() const { return rlo_; }
  long rhi() const { return rlo_ + rows_ - 1; }
  long clo() const { return clo_; }
  long chi() const { return clo_ + cols_ - 1; }
  bool covers(long r0, long r1, long c0, long c1) const { return r0 >= rlo_ && r1 <= rhi() && c0 >= clo_ && c1 <= chi(); }
  void reset() {
    data_.clear();
    data_.shrink_to_fit();
    rows_ = cols_ = 0;
  }

 private:
  std::size_t index(long i, long j) const {
    assert(i >= rlo_ && i <= rhi() && j >= clo_ && j <= chi());
    return static_cast<std::size_t>((i - rlo_) * cols_ + (j - clo_));
  }
  long rlo_ = 1, clo_ = 1, rows_ = 0, cols_ = 0;
  std::vector<T> data_;
};

/// The allocators of the numerical routines: float, int, unsigned char, long, double and
/// long double vectors over lo..hi, and matrices over row and column bounds.
inline NrVector<float> vectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrVector<int> ivectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrVector<unsigned char> cvectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrVector<long> lvectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrVector<double> dvectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrVector<long double> ldvectorOBX(long lo, long hi) { return {lo, hi}; }
inline NrMatrix<float> matrixOBX(long rlo, long rhi, long clo, long chi) { return {rlo, rhi, clo, chi}; }
inline NrMatrix<double> dmatrixOBX(long rlo, long rhi, long clo, long chi) { return {rlo, rhi, clo, chi}; }
inline NrMatrix<long double> ldmatrixOBX(long rlo, long rhi, long clo, long chi) { return {rlo, rhi, clo, chi}; }
inline NrMatrix<int> imatrixOBX(long rlo, long rhi, long clo, long chi) { return {rlo, rhi, clo, chi}; }

/// Releases: storage also goes when the object goes out of scope.
inline void free_vectorOBX(NrVector<float>& v) { v.reset(); }
inline void free_ivectorOBX(NrVector<int>& v) { v.reset(); }
inline void free_cvectorOBX(NrVector<unsigned char>& v) { v.reset(); }
inline void free_lvectorOBX(NrVector<long>& v) { v.reset(); }
inline void free_dvectorOBX(NrVector<double>& v) { v.reset(); }
inline void free_ldvectorOBX(NrVector<long double>& v) { v.reset(); }
inline void free_matrixOBX(NrMatrix<float>& m) { m.reset(); }
inline void free_dmatrixOBX(NrMatrix<double>& m) { m.reset(); }
inline void free_ldmatrixOBX(NrMatrix<long double>& m) { m.reset(); }
inline void free_imatrixOBX(NrMatrix<int>& m) { m.reset(); }

}  // namespace sar::dsp
