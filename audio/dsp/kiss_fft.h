// FFT transformers for complex and real signals of any length.
//
// Forward: X[k] = sum_n x[n] exp(-2 pi i k n / N); inverse: the same with
// +2 pi i, unnormalised unless the facade is built with normalize_inverse,
// which scales every inverse output by 1/N. A real transform of length N has
// N/2 + 1 bins (bins 0 .. N/2).
//
// Back ends: "fast" lengths (2^a 3^b 5^c times 1, 7, 11, 13, 17, 19 or 23)
// go straight to KISS FFT; other lengths use Bluestein's chirp-z algorithm,
// three KISS transforms of a fast length M >= 2N - 1. Real transforms use the
// KISS real FFT for fast even N and a complex back end otherwise.
//
// Plans and tables are built at construction. Objects hold scratch space and
// must not be used by two threads at once. Wrong sizes and null pointers end
// the process through CHECK.
//
// This file and kiss_fft.cc are the only places that know about KISS FFT;
// its headers are included by kiss_fft.cc alone.
#ifndef AUDIO_DSP_KISS_FFT_H_
#define AUDIO_DSP_KISS_FFT_H_

#include <complex>
#include <memory>
#include <span>
#include <vector>

struct kiss_fft_state;
struct kiss_fftr_state;

namespace audio_dsp {

// True when `size` is a KISS-friendly length (see above). Requires size > 0.
bool IsFastFFTSize(int size);

class ComplexFFTTransformerImpl {
 public:
  virtual ~ComplexFFTTransformerImpl() = default;
  virtual int GetSize() const = 0;
  // N complex values in, N out; `output` may equal `input`.
  virtual void Forward(const std::complex<float>* input,
                       std::complex<float>* output) = 0;
  virtual void Inverse(const std::complex<float>* input,
                       std::complex<float>* output) = 0;
};

class RealFFTTransformerImpl {
 public:
  virtual ~RealFFTTransformerImpl() = default;
  virtual int GetSize() const = 0;
  // N reals in, N/2 + 1 complex bins out.
  virtual void Forward(const float* input, std::complex<float>* output) = 0;
  // N/2 + 1 complex bins in, N reals out.
  virtual void Inverse(const std::complex<float>* input, float* output) = 0;
};

class KissComplexFFTTransformerImpl : public ComplexFFTTransformerImpl {
 public:
  explicit KissComplexFFTTransformerImpl(int size);
  ~KissComplexFFTTransformerImpl() override;
  KissComplexFFTTransformerImpl(const KissComplexFFTTransformerImpl&) = delete;
  KissComplexFFTTransformerImpl& operator=(
      const KissComplexFFTTransformerImpl&) = delete;

  int GetSize() const override { return size_; }
  void Forward(const std::complex<float>* input,
               std::complex<float>* output) override;
  void Inverse(const std::complex<float>* input,
               std::complex<float>* output) override;

 private:
  int size_;
  kiss_fft_state* forward_plan_;
  kiss_fft_state* inverse_plan_;
};

// Chirp-z transform of any length N through an inner KISS transform of length
// M = next fast size >= 2N - 1:
//   X[k] = conj(w_k) sum_n (x_n conj(w_n)) w_(k-n),   w_k = exp(i pi k^2 / N),
// the convolution done as a circular one of length M.
class BluesteinComplexFFTTransformerImpl : public ComplexFFTTransformerImpl {
 public:
  explicit BluesteinComplexFFTTransformerImpl(int size);

  int GetSize() const override { return size_; }
  void Forward(const std::complex<float>* input,
               std::complex<float>* output) override;
  void Inverse(const std::complex<float>* input,
               std::complex<float>* output) override;

  // The inner transform length M.
  int GetInnerSize() const { return inner_.GetSize(); }

 private:
  // Multiplies input_k by w_k (inverse) or conj(w_k) (forward) into the
  // zero-padded scratch buffer.
  void Premultiply(const std::complex<float>* input, bool conjugate_chirp);

  int size_;
  KissComplexFFTTransformerImpl inner_;
  std::vector<std::complex<float>> filter_spectrum_;  // B, M bins
  std::vector<std::complex<float>> output_chirp_;     // a_k = conj(w_k) / M
  std::vector<std::complex<float>> scratch_;          // M values
};

// The real KISS FFT; even lengths only.
class KissRealFFTTransformerImpl : public RealFFTTransformerImpl {
 public:
  explicit KissRealFFTTransformerImpl(int size);
  ~KissRealFFTTransformerImpl() override;
  KissRealFFTTransformerImpl(const KissRealFFTTransformerImpl&) = delete;
  KissRealFFTTransformerImpl& operator=(const KissRealFFTTransformerImpl&) =
      delete;

  int GetSize() const override { return size_; }
  void Forward(const float* input, std::complex<float>* output) override;
  void Inverse(const std::complex<float>* input, float* output) override;

 private:
  int size_;
  kiss_fftr_state* forward_plan_;
  kiss_fftr_state* inverse_plan_;
};

// A real transform computed by a complex one (for odd or non-fast lengths).
class ComplexBackendRealFFTTransformerImpl : public RealFFTTransformerImpl {
 public:
  explicit ComplexBackendRealFFTTransformerImpl(
      std::unique_ptr<ComplexFFTTransformerImpl> backend);

  int GetSize() const override { return backend_->GetSize(); }
  void Forward(const float* input, std::complex<float>* output) override;
  void Inverse(const std::complex<float>* input, float* output) override;

 private:
  std::unique_ptr<ComplexFFTTransformerImpl> backend_;
  std::vector<std::complex<float>> scratch_;
};

class ComplexFFTTransformer {
 public:
  // `size` > 0. With `normalize_inverse`, inverse outputs are scaled by 1/N.
  ComplexFFTTransformer(int size, bool normalize_inverse);

  int GetSize() const { return impl_->GetSize(); }

  // `input` must hold GetSize() values; `output` is resized to GetSize() and
  // may be the vector that `input` views.
  void Forward(std::span<const std::complex<float>> input,
               std::vector<std::complex<float>>* output);
  void Inverse(std::span<const std::complex<float>> input,
               std::vector<std::complex<float>>* output);
  // Pointer forms: GetSize() values each.
  void Forward(const std::complex<float>* input, std::complex<float>* output);
  void Inverse(const std::complex<float>* input, std::complex<float>* output);

  const ComplexFFTTransformerImpl& impl() const { return *impl_; }

 private:
  std::unique_ptr<ComplexFFTTransformerImpl> impl_;
  bool normalize_inverse_;
};

class RealFFTTransformer {
 public:
  // `size` > 0. With `normalize_inverse`, inverse outputs are scaled by 1/N.
  RealFFTTransformer(int size, bool normalize_inverse);

  int GetSize() const { return impl_->GetSize(); }
  int GetTransformedSize() const { return GetSize() / 2 + 1; }

  void Forward(std::span<const float> input,
               std::vector<std::complex<float>>* output);
  void Inverse(std::span<const std::complex<float>> input,
               std::vector<float>* output);
  void Forward(const float* input, std::complex<float>* output);
  void Inverse(const std::complex<float>* input, float* output);

  const RealFFTTransformerImpl& impl() const { return *impl_; }

 private:
  std::unique_ptr<RealFFTTransformerImpl> impl_;
  bool normalize_inverse_;
};

}  // namespace audio_dsp

#endif  // AUDIO_DSP_KISS_FFT_H_
