#include "audio/dsp/kiss_fft.h"

#include <kiss_fft.h>
#include <kiss_fftr.h>

#include <cmath>
#include <numbers>
#include <utility>

#include "base/logging.h"

namespace audio_dsp {
namespace {

static_assert(sizeof(kiss_fft_cpx) == sizeof(std::complex<float>),
              "KISS complex values must share std::complex<float>'s layout");

kiss_fft_cpx* AsKiss(std::complex<float>* x) {
  return reinterpret_cast<kiss_fft_cpx*>(x);
}
const kiss_fft_cpx* AsKiss(const std::complex<float>* x) {
  return reinterpret_cast<const kiss_fft_cpx*>(x);
}

// Calls f(k, w_k) for w_k = exp(i pi k^2 / N), k = 0 .. N - 1. The chirp is
// advanced in double by w_(k+1) = w_k r_k, r_k = s^(2k+1), s = exp(i pi / N),
// which avoids one trigonometric call per sample and drifts by only
// ~N^2 * 1e-16 radians.
template <typename F>
void ForEachChirp(int size, F&& f) {
  const double angle = std::numbers::pi / size;
  const std::complex<double> seed(std::cos(angle), std::sin(angle));
  const std::complex<double> seed_squared = seed * seed;
  std::complex<double> w(1.0, 0.0);
  std::complex<double> r = seed;
  for (int k = 0; k < size; ++k) {
    f(k, w);
    w *= r;
    r *= seed_squared;
  }
}

}  // namespace

bool IsFastFFTSize(int size) {
  CHECK(size > 0);
  for (int factor : {2, 3, 5}) {
    while (size % factor == 0) size /= factor;
  }
  return size < 26;
}

KissComplexFFTTransformerImpl::KissComplexFFTTransformerImpl(int size)
    : size_(size),
      forward_plan_(kiss_fft_alloc(size, 0, nullptr, nullptr)),
      inverse_plan_(kiss_fft_alloc(size, 1, nullptr, nullptr)) {
  CHECK(forward_plan_ != nullptr && inverse_plan_ != nullptr);
}

KissComplexFFTTransformerImpl::~KissComplexFFTTransformerImpl() {
  kiss_fft_free(forward_plan_);
  kiss_fft_free(inverse_plan_);
}

void KissComplexFFTTransformerImpl::Forward(const std::complex<float>* input,
                                            std::complex<float>* output) {
  kiss_fft(forward_plan_, AsKiss(input), AsKiss(output));
}

void KissComplexFFTTransformerImpl::Inverse(const std::complex<float>* input,
                                            std::complex<float>* output) {
  kiss_fft(inverse_plan_, AsKiss(input), AsKiss(output));
}

BluesteinComplexFFTTransformerImpl::BluesteinComplexFFTTransformerImpl(
    int size)
    : size_(size), inner_(kiss_fft_next_fast_size(2 * size - 1)) {
  CHECK(size > 0);
  const int m = inner_.GetSize();
  const float inverse_m = 1.0f / static_cast<float>(m);
  std::vector<std::complex<float>> filter(m, {0.0f, 0.0f});
  output_chirp_.resize(size_);
  ForEachChirp(size_, [&](int k, std::complex<double> w) {
    const std::complex<float> wf(w);
    if (k == 0) {
      filter[0] = {1.0f, 0.0f};
      output_chirp_[0] = {inverse_m, 0.0f};
    } else {
      filter[k] = wf;
      filter[m - k] = wf;
      output_chirp_[k] = std::conj(wf) * inverse_m;
    }
  });
  filter_spectrum_.resize(m);
  inner_.Forward(filter.data(), filter_spectrum_.data());
  scratch_.resize(m);
}

void BluesteinComplexFFTTransformerImpl::Premultiply(
    const std::complex<float>* input, bool conjugate_chirp) {
  ForEachChirp(size_, [&](int k, std::complex<double> w) {
    const std::complex<double> chirp = conjugate_chirp ? std::conj(w) : w;
    scratch_[k] = k == 0 ? input[0]
                         : std::complex<float>(
                               std::complex<double>(input[k]) * chirp);
  });
  std::fill(scratch_.begin() + size_, scratch_.end(),
            std::complex<float>(0.0f, 0.0f));
}

void BluesteinComplexFFTTransformerImpl::Forward(
    const std::complex<float>* input, std::complex<float>* output) {
  Premultiply(input, /*conjugate_chirp=*/true);
  inner_.Forward(scratch_.data(), scratch_.data());
  for (size_t k = 0; k < scratch_.size(); ++k) scratch_[k] *= filter_spectrum_[k];
  inner_.Inverse(scratch_.data(), scratch_.data());
  for (int k = 0; k < size_; ++k) output[k] = output_chirp_[k] * scratch_[k];
}

void BluesteinComplexFFTTransformerImpl::Inverse(
    const std::complex<float>* input, std::complex<float>* output) {
  // Convolution with conj(w): its spectrum is conj(B[M - k]).
  Premultiply(input, /*conjugate_chirp=*/false);
  inner_.Forward(scratch_.data(), scratch_.data());
  const int m = static_cast<int>(scratch_.size());
  scratch_[0] *= std::conj(filter_spectrum_[0]);
  for (int k = 1; k < m; ++k) scratch_[k] *= std::conj(filter_spectrum_[m - k]);
  inner_.Inverse(scratch_.data(), scratch_.data());
  for (int k = 0; k < size_; ++k) {
    output[k] = std::conj(output_chirp_[k]) * scratch_[k];
  }
}

KissRealFFTTransformerImpl::KissRealFFTTransformerImpl(int size)
    : size_(size), forward_plan_(nullptr), inverse_plan_(nullptr) {
  CHECK(size > 0 && size % 2 == 0);
  forward_plan_ = kiss_fftr_alloc(size, 0, nullptr, nullptr);
  inverse_plan_ = kiss_fftr_alloc(size, 1, nullptr, nullptr);
  CHECK(forward_plan_ != nullptr && inverse_plan_ != nullptr);
}

KissRealFFTTransformerImpl::~KissRealFFTTransformerImpl() {
  kiss_fftr_free(forward_plan_);
  kiss_fftr_free(inverse_plan_);
}

void KissRealFFTTransformerImpl::Forward(const float* input,
                                         std::complex<float>* output) {
  kiss_fftr(forward_plan_, input, AsKiss(output));
}

void KissRealFFTTransformerImpl::Inverse(const std::complex<float>* input,
                                         float* output) {
  kiss_fftri(inverse_plan_, AsKiss(input), output);
}

ComplexBackendRealFFTTransformerImpl::ComplexBackendRealFFTTransformerImpl(
    std::unique_ptr<ComplexFFTTransformerImpl> backend)
    : backend_(std::move(backend)) {
  CHECK(backend_ != nullptr);
  scratch_.resize(backend_->GetSize());
}

void ComplexBackendRealFFTTransformerImpl::Forward(
    const float* input, std::complex<float>* output) {
  const int n = GetSize();
  for (int i = 0; i < n; ++i) scratch_[i] = {input[i], 0.0f};
  backend_->Forward(scratch_.data(), scratch_.data());
  std::copy(scratch_.begin(), scratch_.begin() + n / 2 + 1, output);
}

void ComplexBackendRealFFTTransformerImpl::Inverse(
    const std::complex<float>* input, float* output) {
  const int n = GetSize();
  // Hermitian completion: X[n - k] = conj(X[k]).
  std::copy(input, input + n / 2 + 1, scratch_.begin());
  for (int k = 1; k < n - n / 2; ++k) scratch_[n - k] = std::conj(input[k]);
  backend_->Inverse(scratch_.data(), scratch_.data());
  for (int i = 0; i < n; ++i) output[i] = scratch_[i].real();
}

namespace {

std::unique_ptr<ComplexFFTTransformerImpl> MakeComplexImpl(int size) {
  if (IsFastFFTSize(size)) {
    return std::make_unique<KissComplexFFTTransformerImpl>(size);
  }
  return std::make_unique<BluesteinComplexFFTTransformerImpl>(size);
}

std::unique_ptr<RealFFTTransformerImpl> MakeRealImpl(int size) {
  if (IsFastFFTSize(size) && size % 2 == 0) {
    return std::make_unique<KissRealFFTTransformerImpl>(size);
  }
  return std::make_unique<ComplexBackendRealFFTTransformerImpl>(
      MakeComplexImpl(size));
}

template <typename T>
void Scale(T* values, int count, int size) {
  const float scale = 1.0f / static_cast<float>(size);
  for (int i = 0; i < count; ++i) values[i] *= scale;
}

}  // namespace

ComplexFFTTransformer::ComplexFFTTransformer(int size, bool normalize_inverse)
    : normalize_inverse_(normalize_inverse) {
  CHECK(size > 0);
  impl_ = MakeComplexImpl(size);
}

void ComplexFFTTransformer::Forward(std::span<const std::complex<float>> input,
                                    std::vector<std::complex<float>>* output) {
  CHECK_EQ(input.size(), GetSize());
  CHECK(output);
  output->resize(GetSize());
  impl_->Forward(input.data(), output->data());
}

void ComplexFFTTransformer::Inverse(std::span<const std::complex<float>> input,
                                    std::vector<std::complex<float>>* output) {
  CHECK_EQ(input.size(), GetSize());
  CHECK(output);
  output->resize(GetSize());
  Inverse(input.data(), output->data());
}

void ComplexFFTTransformer::Forward(const std::complex<float>* input,
                                    std::complex<float>* output) {
  CHECK(input);
  CHECK(output);
  impl_->Forward(input, output);
}

void ComplexFFTTransformer::Inverse(const std::complex<float>* input,
                                    std::complex<float>* output) {
  CHECK(input);
  CHECK(output);
  impl_->Inverse(input, output);
  if (normalize_inverse_) Scale(output, GetSize(), GetSize());
}

RealFFTTransformer::RealFFTTransformer(int size, bool normalize_inverse)
    : normalize_inverse_(normalize_inverse) {
  CHECK(size > 0);
  impl_ = MakeRealImpl(size);
}

void RealFFTTransformer::Forward(std::span<const float> input,
                                 std::vector<std::complex<float>>* output) {
  CHECK_EQ(input.size(), GetSize());
  CHECK(output);
  output->resize(GetTransformedSize());
  impl_->Forward(input.data(), output->data());
}

void RealFFTTransformer::Inverse(std::span<const std::complex<float>> input,
                                 std::vector<float>* output) {
  CHECK_EQ(input.size(), GetTransformedSize());
  CHECK(output);
  output->resize(GetSize());
  Inverse(input.data(), output->data());
}

void RealFFTTransformer::Forward(const float* input,
                                 std::complex<float>* output) {
  CHECK(input);
  CHECK(output);
  impl_->Forward(input, output);
}

void RealFFTTransformer::Inverse(const std::complex<float>* input,
                                 float* output) {
  CHECK(input);
  CHECK(output);
  impl_->Inverse(input, output);
  if (normalize_inverse_) Scale(output, GetSize(), GetSize());
}

}  // namespace audio_dsp
