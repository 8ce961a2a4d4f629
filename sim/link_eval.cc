#include "sim/link_eval.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <memory>
#include <random>
#include <sstream>

#include "audio/modem_config.h"

namespace sorvel_sim {

TrialResult RunTrial(const LinkSetup& setup, double snr_db, uint64_t seed) {
  std::mt19937_64 rng(seed);
  const bool dtmf = setup.scheme == "dtmf";
  std::vector<uint8_t> message(dtmf ? 3 : 6);
  for (uint8_t& b : message) b = static_cast<uint8_t>(rng());
  const auto encoder =
      dtmf ? audio_sorvane::MakeDtmfEncoder({}) : audio_sorvane::MakeDsssEncoder({});
  std::vector<float> token_audio;
  encoder->Encode(message, &token_audio, 2);

  // The phone starts playing at a random point of the token loop.
  std::vector<float> broadcast =
      RenderLoopedBroadcast(*encoder, token_audio, setup.seconds + 1.0);
  const size_t offset = std::uniform_int_distribution<size_t>(0, token_audio.size())(rng);
  broadcast.erase(broadcast.begin(), broadcast.begin() + offset);
  ChannelConfig channel = setup.channel;
  channel.input_rate = encoder->OutputSampleRate();
  channel.snr_db = snr_db;
  channel.seed = seed;
  std::vector<float> received = ApplyChannel(broadcast, channel);
  const double rate = channel.output_rate;
  received.resize(static_cast<size_t>(setup.seconds * rate) * channel.channels);
  // What a phone delivers: 16-bit integers.
  for (float& v : received) v = std::clamp(std::round(v), -32768.0f, 32767.0f);

  std::unique_ptr<audio_sorvane::AudioModemDecoder> decoder;
  if (dtmf) {
    audio_sorvane::DtmfDecoderConfig config;
    config.num_channels = channel.channels;
    config.input_sample_rate = static_cast<float>(rate);
    decoder = audio_sorvane::MakeDtmfDecoder(config);
  } else {
    audio_sorvane::DsssDecoderConfig config;
    config.num_channels = channel.channels;
    config.input_sample_rate = static_cast<float>(rate);
    config.with_hotsound = setup.scheme == "hotsound";
    decoder = audio_sorvane::MakeDsssDecoder(config);
  }

  TrialResult result;
  const size_t block = static_cast<size_t>(rate / 100) * channel.channels;
  const size_t per_request =
      static_cast<size_t>(setup.request_interval * rate) * channel.channels;
  audio_sorvane::AudioModemDecoder::DecodeResults results;
  const int message_bytes = static_cast<int>(message.size());
  size_t since_request = 0;
  const auto start = std::chrono::steady_clock::now();
  for (size_t pos = 0; pos < received.size(); pos += block) {
    const size_t size = std::min(block, received.size() - pos);
    decoder->ProcessSamples(std::span<const float>(received).subspan(pos, size));
    result.audio_seconds += size / (rate * channel.channels);
    since_request += size;
    if (since_request < per_request) continue;
    since_request = 0;
    if (decoder->DecodeTokens(&results, message_bytes, 2)) {
      // The first token counts, right or wrong.
      result.success = results.tokens[0].bytes == message;
      result.wrong_token = !result.success;
      if (result.success) {
        result.first_token_seconds = (pos + size) / (rate * channel.channels);
      }
      break;
    }
  }
  result.decode_seconds =
      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
  return result;
}

namespace {

// Totals over the points of one curve.
struct CurveTally {
  double audio = 0.0, decode = 0.0, first_sum = 0.0;
  int first_count = 0, done = 0, total = 0;
};

// `seeds` trials of one setup at one SNR, seeds counted from `seed_base`.
CurvePoint RunPoint(const LinkSetup& setup, CurvePoint point, uint64_t seed_base, int seeds,
                    const std::function<void(int, int)>& progress, CurveTally* tally) {
  double point_first = 0.0;
  for (int s = 0; s < seeds; ++s) {
    const TrialResult t = RunTrial(setup, point.snr_db, seed_base + s);
    ++point.trials;
    tally->audio += t.audio_seconds;
    tally->decode += t.decode_seconds;
    if (t.success) {
      ++point.successes;
      point_first += t.first_token_seconds;
    }
    point.wrong_tokens += t.wrong_token;
    if (progress) progress(++tally->done, tally->total);
  }
  if (point.successes > 0) point.mean_first_token_seconds = point_first / point.successes;
  tally->first_sum += point_first;
  tally->first_count += point.successes;
  return point;
}

void Finish(const CurveTally& tally, Curve* curve) {
  if (tally.first_count > 0) curve->mean_first_token_seconds = tally.first_sum / tally.first_count;
  if (tally.decode > 0.0) curve->real_time_factor = tally.audio / tally.decode;
}

}  // namespace

Curve EvaluateCurve(const LinkSetup& setup, const std::string& label,
                    const std::vector<double>& snrs_db, int seeds,
                    const std::function<void(int, int)>& progress) {
  Curve curve;
  curve.label = label;
  CurveTally tally;
  tally.total = static_cast<int>(snrs_db.size()) * seeds;
  bool leading = true;
  for (double snr : snrs_db) {
    const CurvePoint point =
        RunPoint(setup, {.snr_db = snr}, 1000003ULL * static_cast<uint64_t>(snr + 1000), seeds,
                 progress, &tally);
    if (leading && point.success_rate() >= 0.95) {
      curve.lowest_snr_db = snr;
    } else {
      leading = false;
    }
    curve.points.push_back(point);
  }
  Finish(tally, &curve);
  return curve;
}

Curve EvaluateDistances(const LinkSetup& setup, const std::string& label,
                        const std::vector<double>& distances_m, double snr_db, int seeds,
                        const std::function<void(int, int)>& progress) {
  Curve curve;
  curve.label = label;
  CurveTally tally;
  tally.total = static_cast<int>(distances_m.size()) * seeds;
  for (double distance : distances_m) {
    LinkSetup at = setup;
    at.channel.room.distance = distance;
    // The same trials (placements, messages, noise) for a distance
    // whatever else is asked, and for every scheme.
    curve.points.push_back(RunPoint(at, {.snr_db = snr_db, .distance_m = distance},
                                    1000003ULL * static_cast<uint64_t>(distance * 1000), seeds,
                                    progress, &tally));
  }
  Finish(tally, &curve);
  return curve;
}

namespace {

// Success rate against x_of(point), one polyline per curve, x ticks every
// step_for(range of x); the x axis starts at 0 with `from_zero`.
std::string RenderPlot(const std::vector<Curve>& curves, const std::string& title,
                       const std::string& x_label,
                       const std::function<double(const CurvePoint&)>& x_of,
                       const std::function<double(double)>& step_for, bool from_zero) {
  constexpr double kWidth = 720, kHeight = 440, kLeft = 70, kRight = 180, kTop = 50,
                   kBottom = 60;
  double lo = 0, hi = 0;
  bool first = true;
  for (const Curve& c : curves) {
    for (const CurvePoint& p : c.points) {
      lo = first ? x_of(p) : std::min(lo, x_of(p));
      hi = first ? x_of(p) : std::max(hi, x_of(p));
      first = false;
    }
  }
  if (from_zero) lo = std::min(lo, 0.0);
  if (hi <= lo) hi = lo + 1;
  const double plot_w = kWidth - kLeft - kRight, plot_h = kHeight - kTop - kBottom;
  const auto x = [&](double value) { return kLeft + (value - lo) / (hi - lo) * plot_w; };
  const auto y = [&](double rate) { return kTop + (1.0 - rate) * plot_h; };
  static const char* kColors[] = {"#1f77b4", "#d62728", "#2ca02c", "#ff7f0e",
                                  "#9467bd", "#8c564b", "#17becf", "#7f7f7f"};
  std::ostringstream svg;
  svg.setf(std::ios::fixed);
  svg.precision(1);
  svg << "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" << kWidth << "\" height=\""
      << kHeight << "\" font-family=\"sans-serif\" font-size=\"12\">\n"
      << "<rect width=\"100%\" height=\"100%\" fill=\"white\"/>\n"
      << "<text x=\"" << kWidth / 2 << "\" y=\"28\" text-anchor=\"middle\" font-size=\"15\">"
      << title << "</text>\n";
  for (int pct = 0; pct <= 100; pct += 20) {
    svg << "<line x1=\"" << kLeft << "\" x2=\"" << kLeft + plot_w << "\" y1=\"" << y(pct / 100.0)
        << "\" y2=\"" << y(pct / 100.0) << "\" stroke=\"#ddd\"/>\n"
        << "<text x=\"" << kLeft - 8 << "\" y=\"" << y(pct / 100.0) + 4
        << "\" text-anchor=\"end\">" << pct << " %</text>\n";
  }
  const double step = step_for(hi - lo);
  for (double tick = std::ceil(lo / step - 1e-9) * step; tick <= hi + 1e-9; tick += step) {
    svg << "<line x1=\"" << x(tick) << "\" x2=\"" << x(tick) << "\" y1=\"" << kTop
        << "\" y2=\"" << kTop + plot_h << "\" stroke=\"#eee\"/>\n"
        << "<text x=\"" << x(tick) << "\" y=\"" << kTop + plot_h + 18
        << "\" text-anchor=\"middle\">" << tick << "</text>\n";
  }
  svg << "<rect x=\"" << kLeft << "\" y=\"" << kTop << "\" width=\"" << plot_w
      << "\" height=\"" << plot_h << "\" fill=\"none\" stroke=\"#333\"/>\n"
      << "<text x=\"" << kLeft + plot_w / 2 << "\" y=\"" << kHeight - 15
      << "\" text-anchor=\"middle\">" << x_label << "</text>\n"
      << "<text transform=\"rotate(-90)\" x=\"" << -(kTop + plot_h / 2) << "\" y=\"18\" "
      << "text-anchor=\"middle\">tokens decoded</text>\n";
  for (size_t i = 0; i < curves.size(); ++i) {
    const char* color = kColors[i % 8];
    svg << "<polyline fill=\"none\" stroke=\"" << color << "\" stroke-width=\"2\" points=\"";
    for (const CurvePoint& p : curves[i].points) {
      svg << x(x_of(p)) << "," << y(p.success_rate()) << " ";
    }
    svg << "\"/>\n";
    for (const CurvePoint& p : curves[i].points) {
      svg << "<circle cx=\"" << x(x_of(p)) << "\" cy=\"" << y(p.success_rate())
          << "\" r=\"3\" fill=\"" << color << "\"/>\n";
    }
    const double ly = kTop + 10 + 22 * static_cast<double>(i);
    svg << "<line x1=\"" << kLeft + plot_w + 15 << "\" x2=\"" << kLeft + plot_w + 40
        << "\" y1=\"" << ly << "\" y2=\"" << ly << "\" stroke=\"" << color
        << "\" stroke-width=\"2\"/>\n<text x=\"" << kLeft + plot_w + 46 << "\" y=\"" << ly + 4
        << "\">" << curves[i].label << "</text>\n";
  }
  svg << "</svg>\n";
  return svg.str();
}

}  // namespace

std::string RenderSvg(const std::vector<Curve>& curves, const std::string& title) {
  return RenderPlot(
      curves, title, "full-band SNR (dB)", [](const CurvePoint& p) { return p.snr_db; },
      [](double range) { return range > 20 ? 5.0 : 2.0; }, /*from_zero=*/false);
}

std::string RenderDistanceSvg(const std::vector<Curve>& curves, const std::string& title) {
  return RenderPlot(
      curves, title, "loudspeaker to microphone (m)",
      [](const CurvePoint& p) { return p.distance_m; },
      [](double range) { return range > 10 ? 2.0 : range > 4 ? 1.0 : 0.5; }, /*from_zero=*/true);
}

}  // namespace sorvel_sim
