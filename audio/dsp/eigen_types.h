// The dense vector and matrix types of the modem: column-major Eigen types
// with rows()/cols(). Score tables are frequencies x samples, phasor matrices
// frequencies x taps.
#ifndef AUDIO_DSP_EIGEN_TYPES_H_
#define AUDIO_DSP_EIGEN_TYPES_H_

#include <Eigen/Core>

namespace audio_dsp {

using FloatVector = Eigen::VectorXf;
using ComplexVector = Eigen::VectorXcf;
using FloatMatrix = Eigen::MatrixXf;
using ComplexMatrix = Eigen::MatrixXcf;
using FloatArray = Eigen::ArrayXf;
using ComplexArray = Eigen::ArrayXcf;

// For per-row passes over long rows (one row per tone, in time order).
using RowMajorFloatMatrix = Eigen::Matrix<float, Eigen::Dynamic, Eigen::Dynamic, Eigen::RowMajor>;

static_assert(!FloatMatrix::IsRowMajor && !ComplexMatrix::IsRowMajor,
              "score and phasor tables are column-major");

}  // namespace audio_dsp

#endif  // AUDIO_DSP_EIGEN_TYPES_H_
