#pragma once

#include <zlib.h>

#include <cstdint>
#include <cstring>
#include <string>

// Payloads of every version of the format, put together byte by byte from its table in
// docs/state_format.md, without any of the code that writes and reads them.
namespace kelp::effect {

struct Sample {
  std::uint32_t version = 16;
  int frames = 2, slots = 3;
  int width = 64, height = 36;  // the grid is 64 by 36, too
  int phase = 2;
  bool has_job = true;
  bool has_crop = true;
  std::string step_scale = "24000";
};

inline constexpr int kSampleCols = 64, kSampleRows = 36;
inline constexpr std::int64_t kSampleSolveHash = 0x89abcdef, kSampleCropHash = 0xfffffffe;
inline constexpr std::uint64_t kSampleTick = 0x0102030405060708;

class Bytes {
 public:
  template <class T>
  Bytes& Put(T value) {
    char raw[sizeof value];
    std::memcpy(raw, &value, sizeof value);
    data_.append(raw, sizeof value);
    return *this;
  }
  Bytes& I32(std::int64_t value) { return Put(static_cast<std::int32_t>(value)); }
  Bytes& F64(double value) { return Put(value); }
  Bytes& Flag(int value) { return Put(static_cast<std::uint8_t>(value)); }
  Bytes& Text(const std::string& ascii) {
    Put(static_cast<std::uint32_t>(ascii.size()));
    for (const char c : ascii) Put(static_cast<std::uint16_t>(c));
    return *this;
  }
  Bytes& Raw(const std::string& bytes) {
    data_ += bytes;
    return *this;
  }
  const std::string& data() const { return data_; }

 private:
  std::string data_;
};

inline std::string SampleTime(const std::string& value, const std::string& scale) {
  return "{\"value\":" + value + ",\"scale\":" + scale + "}";
}

inline std::string SampleJobInput(const Sample& sample) {
  return R"({"ProjectPath":"","SourceID":"00000000-0000-0000-0000-000000000000","FieldType":0,)"
         R"("StartTime":)" +
         SampleTime("0", "1") + R"(,"Duration":)" + SampleTime("2002", sample.step_scale) +
         R"(,"StepTime":)" + SampleTime("1001", sample.step_scale) + "}";
}

inline std::string SampleJob(const Sample& sample) {
  return R"({"job_guid":"10111213-1415-1617-1819-1a1b1c1d1e1f","job_input_parameters":)" +
         SampleJobInput(sample) +
         R"(,"selector_params":{"max_count":500,"spacing":11,"half_winx":5,"half_winy":5,)"
         R"("border":12,"threshold":0.019999999552965164,"min_eig":1.0,"max_eig":6000.0,)"
         R"("presmoothing":true,"presmooth_factor":0.10000000149011612,)"
         R"("eig_ratio_threshold":15.0},"tracker_params":{"max_iterations":25,)"
         R"("tolerance_translation":0.1,"tolerance_affine":0.05,"pyramidal_levels":5,)"
         R"("half_win_x":7,"half_win_y":7,"color_correction_translation":0,)"
         R"("color_correction_affine":2,"affine_verification":true,"tolerance_color_lambda":0.05,)"
         R"("tolerance_color_delta":1.0,"tolerance_min_correlation":0.7,)"
         R"("tolerance_primary_color_threshold":5.0,"kill_tracks_shorter_than":0},)"
         R"("job_stage":2,"tracker_guid":"20212223-2425-2627-2829-2a2b2c2d2e2f"})";
}

inline std::string SampleGuid(char first) {
  std::string bytes;
  for (int i = 0; i < 16; ++i) bytes += static_cast<char>(first + i);
  return bytes;
}

// The plain bytes.
inline std::string SamplePayload(const Sample& sample) {
  const std::uint32_t v = sample.version;
  Bytes out;
  const auto mark = [&](const char* reversed) {
    if (v >= 12) out.Raw(reversed);
  };
  mark("batS");
  if (v >= 12) out.I32(sample.width).I32(sample.height).I32(1).I32(1);
  out.I32(sample.frames).Put(static_cast<std::uint64_t>(sample.slots));
  out.Text(SampleJobInput(sample));
  if (v >= 14) out.Raw(SampleGuid(0x30));
  if (v >= 8) out.Put(kSampleTick);
  mark("diuG");
  if (v >= 5) out.Raw(SampleGuid(0x50));
  if (v >= 6) out.Flag(0);
  if (v >= 11) out.Flag(0);
  if (v >= 15) out.Flag(1);
  out.Flag(sample.has_job);
  if (sample.has_job) out.Text(SampleJob(sample));
  if (v >= 7) {
    mark("vloS");
    out.I32(sample.phase).Put(kSampleSolveHash).Put(kSampleCropHash);
    mark("hseM");
    if (sample.phase == 2) {
      out.I32(kSampleCols).I32(kSampleRows);
      for (int f = 0; f < sample.frames; ++f) {
        const double left = 0.25 + f, top = -0.5 * f, right = left + 63, bottom = top + 35;
        out.F64(left).F64(top).F64(right).F64(top).F64(left).F64(bottom).F64(right).F64(bottom);
        for (int i = 0; i < kSampleCols * kSampleRows; ++i) {
          // Corners stand for themselves.
          const int c = i % kSampleCols, r = i / kSampleCols;
          const bool corner = (c == 0 || c == kSampleCols - 1) && (r == 0 || r == kSampleRows - 1);
          out.I32(corner ? 0 : (i + f) % 7 - 3).I32(corner ? 0 : -(i % 5));
        }
      }
      if (v >= 10) {
        out.Raw("NotM").I32(2).I32(1);
        for (const int m : {0, 1}) {
          out.I32(m).I32(1 - m);
          for (const double entry : {1.0, 0.0, 2.5 - m, 0.0, 1.0, -0.75, 1e-6, 0.0, 1.0}) {
            out.F64(entry);
          }
        }
      }
    } else {
      if (v >= 10) out.Raw("NotM");
      out.I32(0).I32(0);
    }
  }
  mark("FrtS");
  out.I32(7);
  for (int i = 0; i < sample.frames * sample.slots; ++i) {
    if (v >= 4) {
      out.I32(32 * 10 + i).I32(-16 * i);  // 10 + i / 32 pixels, -i / 2 pixels
    } else {
      out.Put(10.0f + static_cast<float>(i) / 32).Put(-0.5f * static_cast<float>(i));
    }
  }
  for (int i = 0; i < sample.frames * sample.slots; ++i) {
    out.I32(i < sample.slots ? 1 : i % 2 == 0 ? 0 : -11);
  }
  if (v >= 16) {
    out.Raw("porC").Flag(sample.has_crop);
    if (sample.has_crop) {
      out.I32(sample.frames).I32(66).I32(38).I32(50).I32(30);
      for (int f = 0; f < sample.frames; ++f) {
        const float left = 3.0f + static_cast<float>(f);
        out.Put(left).Put(2.5f).Put(left + 49).Put(31.5f);
      }
    }
  }
  mark(" puP");
  return out.data();
}

inline std::string Deflated(const std::string& bytes) {
  uLongf size = compressBound(static_cast<uLong>(bytes.size()));
  std::string out(size, '\0');
  compress(reinterpret_cast<Bytef*>(out.data()), &size,
           reinterpret_cast<const Bytef*>(bytes.data()), static_cast<uLong>(bytes.size()));
  out.resize(size);
  return out;
}

}  // namespace kelp::effect
