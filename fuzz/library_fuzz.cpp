// Whatever is called of the C library, in whatever order and with whatever arguments that its
// header allows, every call ends with a code and nothing is left.

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "fuzz/library_input.h"
#include "fuzz/saved_work.h"
#include "library/calmframe.h"

namespace {

using namespace calmframe::fuzz;

void Expect(bool holds) {
  if (!holds) std::abort();
}

// Exactly as many bytes as the planes have, each in a block of its own.
class Planes {
 public:
  explicit Planes(const calmframe_options& options, std::uint8_t kind) {
    const std::int64_t word = options.depth <= 8 ? 1 : options.depth <= 16 ? 2 : 4;
    const bool planar = options.format >= CALMFRAME_YUV420P;
    const bool is_rgb = options.format == CALMFRAME_RGB || options.format == CALMFRAME_BGR;
    const int components = planar ? 1 : is_rgb ? 3 : 4;
    image_.width = options.width;
    image_.height = options.height;
    for (int plane = 0; plane < (planar ? 3 : 1); ++plane) {
      const bool half_wide = plane > 0 && options.format != CALMFRAME_YUV444P;
      const bool half_high = plane > 0 && options.format == CALMFRAME_YUV420P;
      const std::int64_t width = half_wide ? options.width / 2 : options.width,
                         height = half_high ? options.height / 2 : options.height;
      const std::int64_t row = width * components * word;
      const std::int64_t stride = kind & kWideRows ? row + 4 * word : row;
      const std::int64_t size = stride * (height - 1) + row;
      auto& bytes = bytes_[static_cast<std::size_t>(plane)];
      bytes.reset(new std::uint8_t[static_cast<std::size_t>(size)]);
      std::memset(bytes.get(), 0, static_cast<std::size_t>(size));
      const bool is_upside_down = !planar && (kind & kUpsideDown);
      image_.plane[plane] = bytes.get() + (is_upside_down ? stride * (height - 1) : 0);
      image_.stride[plane] = is_upside_down ? -stride : stride;
      rows_[static_cast<std::size_t>(plane)] = row;
      heights_[static_cast<std::size_t>(plane)] = height;
    }
    word_ = word;
    is_real_ = word == 4;
  }

  // Blocks that move with the frames; with the kind some noise.
  void Draw(std::int64_t frame, std::uint8_t kind) {
    for (int plane = 0; plane < 3 && bytes_[static_cast<std::size_t>(plane)]; ++plane) {
      DrawInto(image_, plane, frame, kind);
    }
  }
  // As a session's own buffer has it.
  void DrawInto(const calmframe_image& image, int plane, std::int64_t frame,
                std::uint8_t kind) const {
    const std::int64_t row = rows_[static_cast<std::size_t>(plane)];
    for (std::int64_t y = 0; y < heights_[static_cast<std::size_t>(plane)]; ++y) {
      auto* const begin = static_cast<std::uint8_t*>(image.plane[plane]) + image.stride[plane] * y;
      for (std::int64_t x = 0; x < row / word_; ++x) {
        const auto place =
            static_cast<std::uint32_t>((x + 3 * frame) / 5 * 7919 + (y + 2 * frame) / 5 * 104729);
        const std::uint32_t noise = place * 2654435761u >> 24;
        const auto value = static_cast<std::uint8_t>(kind & kFlat ? 90 : noise);
        if (is_real_) {
          const float real =
              kind & kNoNumbers ? NotANumber(value) : static_cast<float>(value) / 255;
          std::memcpy(begin + x * 4, &real, 4);
        } else {
          begin[x * word_] = value;
          if (word_ == 2) begin[x * 2 + 1] = kind & kNoNumbers ? value : 0;
        }
      }
    }
  }
  int planes() const { return bytes_[1] ? 3 : 1; }
  calmframe_image& image() { return image_; }

 private:
  static float NotANumber(std::uint8_t value) {
    const std::uint32_t bits = 0x7f800000u | std::uint32_t{value} << 16 | value;
    float real;
    std::memcpy(&real, &bits, sizeof real);
    return real;
  }

  calmframe_image image_{};
  std::array<std::unique_ptr<std::uint8_t[]>, 3> bytes_;
  std::array<std::int64_t, 3> rows_{}, heights_{};
  std::int64_t word_ = 1;
  bool is_real_ = false;
};

struct Opened {
  calmframe_session handle = nullptr;  // null: refused, or closed
  calmframe_options options{};
  std::uint8_t images = 0;
  std::int64_t refuses = -1;  // frame that a fetch refuses
};

std::int32_t Fetch(void* user, std::int64_t frame, calmframe_image* image) {
  auto& session = *static_cast<Opened*>(user);
  Expect(frame >= 0 && frame < session.options.frame_count);
  if (frame == session.refuses) return 1;
  const Planes planes(session.options, 0);
  for (int plane = 0; plane < planes.planes(); ++plane) {
    planes.DrawInto(*image, plane, frame, session.images);
  }
  return 0;
}

// Frames of so few pixels that a session is worked in a blink.
void Open(Input& input, Opened& session) {
  if (session.handle) return;
  const auto asked = input.Take<OpenInput>();
  calmframe_options& options = session.options;
  calmframe_options_init(&options);
  options.width = asked.width % (kMostSide + 1);
  options.height = asked.height % (kMostSide + 1);
  options.format = asked.format;
  options.depth = asked.depth;
  options.matrix = asked.matrix;
  options.chroma_location = asked.chroma_location;
  options.full_range = asked.flags & kFullRange ? 1 : 0;
  options.field_order = asked.fields;
  options.aspect_num = asked.aspect_num;
  options.aspect_den = asked.aspect_den;
  options.rate_num = asked.rate_num;
  options.rate_den = asked.rate_den;
  options.frame_count = asked.frame_count;
  // Of frames that are still to be pushed each takes 8 KiB, as the header says.
  constexpr std::int64_t kMostFrames = 10'000'000, kFewFrames = 64;
  if (asked.frame_count > kFewFrames && asked.frame_count <= kMostFrames) {
    options.frame_count = asked.frame_count % kFewFrames + 1;
  }
  const std::vector<std::int64_t> starts(asked.starts, asked.starts + std::size(asked.starts));
  options.shots = asked.shots;
  options.shot_starts = starts.data();
  options.shot_start_count = asked.flags & kTwoStarts ? 2 : 1;
  options.identity = asked.flags & kIdentity ? "clip" : nullptr;
  session.images = asked.images;
  session.refuses = asked.refuses;
  if (asked.flags & kFetches) {
    options.frame_count = 1 + (asked.frame_count & 7);
    options.fetch = Fetch;
    options.user = &session;
  }
  const calmframe_result result =
      calmframe_open(asked.flags & kNoOptions ? nullptr : &options, &session.handle);
  Expect((result == CALMFRAME_OK) == (session.handle != nullptr));
}

bool IsCode(calmframe_result result) {
  return result >= CALMFRAME_ERROR_FILE && result <= CALMFRAME_AGAIN;  // a fault's own is none
}

void Push(Opened& session, std::int64_t frame, std::uint8_t kind) {
  calmframe_options options = session.options;
  if (kind & kOtherSize) options.width += 1;
  if (!session.handle) return;
  Planes planes(options, kind);
  planes.Draw(frame, session.images);
  if (kind & kNoPlane) planes.image().plane[0] = nullptr;
  Expect(IsCode(
      calmframe_try_push(session.handle, frame, kind & kNoImage ? nullptr : &planes.image())));
}

void Render(Opened& session, std::int64_t frame, std::uint8_t kind) {
  if (!session.handle) return;
  Planes source(session.options, kind), out(session.options, kind);
  source.Draw(frame, session.images);
  Expect(IsCode(calmframe_render(session.handle, frame, kind & kNoImage ? nullptr : &source.image(),
                                 kind & kNoPlane ? nullptr : &out.image())));
}

// All that only looks.
void Ask(calmframe_session session, std::uint8_t what) {
  std::int32_t state = 0;
  calmframe_progress progress;
  calmframe_outcome outcome;
  calmframe_shot shot;
  std::size_t shots = 0;
  std::vector<calmframe_place> places(4);
  char text[64];
  const bool gives = what & 128;
  calmframe_result result = CALMFRAME_OK;
  char* json = nullptr;
  switch (what % 8) {
    case 0:
      result = calmframe_get_state(session, gives ? &state : nullptr);
      break;
    case 1:
      result = calmframe_get_progress(session, gives ? &progress : nullptr);
      break;
    case 2:
      result = calmframe_get_outcome(session, gives ? &outcome : nullptr);
      break;
    case 3:
      result = calmframe_get_shot_count(session, gives ? &shots : nullptr);
      break;
    case 4:
      result = calmframe_get_shot(session, what >> 3 & 7, gives ? &shot : nullptr);
      break;
    case 5:
      result = calmframe_get_path(session, (what >> 3 & 7) - 1, what >> 5 & 3, places.data());
      break;
    case 6:
      result = calmframe_get_report(session, gives ? &json : nullptr);
      break;
    default:
      calmframe_error_text(session, text, what >> 3 & 31);
      result = calmframe_get_controls(session, gives ? &json : nullptr);
  }
  Expect(IsCode(result));
  calmframe_free(json);
}

void SaveAndLoad(Opened& from, Opened& to) {
  void* bytes = nullptr;
  std::size_t size = 0;
  const calmframe_result saved = calmframe_save(from.handle, &bytes, &size);
  Expect(IsCode(saved) && (saved == CALMFRAME_OK) == (bytes != nullptr));
  if (bytes) Expect(IsCode(calmframe_load(to.handle, bytes, size)));
  calmframe_free(bytes);
}

void Load(Input& input, const Opened& session) {
  static const ScratchFile file;
  unlink(file.path().c_str());
  if (!MakeSavedWork(input, file)) return;
  calmframe_saved saved;
  Expect(IsCode(calmframe_get_saved_file(file.path().c_str(), &saved)));
  Expect(IsCode(calmframe_load_file(session.handle, file.path().c_str())));
  Expect(IsCode(calmframe_start(session.handle)));
  // One whose frames are pushed may wait for them for ever.
  Expect(IsCode(calmframe_wait(session.handle, 500)));
}

void Call(Input& input, std::array<Opened, 2>& sessions) {
  const auto call = input.Take<std::uint8_t>();
  Opened& session = sessions[call >> 7];
  switch (static_cast<LibraryCall>(call % static_cast<int>(LibraryCall::count))) {
    case LibraryCall::open:
      return Open(input, session);
    case LibraryCall::close:
      Expect((calmframe_close(session.handle) == CALMFRAME_OK) == (session.handle != nullptr));
      // Closed, and not known any more.
      Expect(calmframe_close(session.handle) == CALMFRAME_ERROR_ARGUMENT);
      session.handle = nullptr;
      return;
    case LibraryCall::set: {
      const std::string name = input.TakeText(), value = input.TakeText();
      Expect(IsCode(calmframe_set(session.handle, name.c_str(), value.c_str())));
      return;
    }
    case LibraryCall::start:
      Expect(IsCode(calmframe_start(session.handle)));
      return;
    case LibraryCall::push: {
      const auto frame = input.Take<std::int8_t>();
      return Push(session, frame, input.Take<std::uint8_t>());
    }
    case LibraryCall::push_some: {
      const auto frames = input.Take<std::uint8_t>() % 12;
      for (int frame = 0; frame < frames; ++frame) {
        Push(session, frame, 0);
        calmframe_wait(session.handle, 1);
      }
      return;
    }
    case LibraryCall::finish:
      Expect(IsCode(calmframe_finish(session.handle)));
      return;
    case LibraryCall::wait:
      Expect(IsCode(calmframe_wait(session.handle, input.Take<std::uint8_t>())));
      return;
    case LibraryCall::cancel:
      Expect(IsCode(calmframe_cancel(session.handle)));
      return;
    case LibraryCall::ask:
      return Ask(session.handle, input.Take<std::uint8_t>());
    case LibraryCall::render: {
      const auto frame = input.Take<std::int8_t>();
      return Render(session, frame, input.Take<std::uint8_t>());
    }
    case LibraryCall::save_and_load:
      return SaveAndLoad(session, sessions[call >> 7 ^ 1]);
    default:
      return Load(input, session);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  Input input(data, size);
  std::array<Opened, 2> sessions;
  constexpr int kMostCalls = 40;
  for (int calls = 0; calls < kMostCalls && !input.is_over(); ++calls) Call(input, sessions);
  for (const Opened& session : sessions) {
    if (session.handle) Expect(calmframe_close(session.handle) == CALMFRAME_OK);
  }
  return 0;
}
