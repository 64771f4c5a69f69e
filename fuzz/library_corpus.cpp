// Writes a corpus for library_fuzz into a folder: sequences of calls as programs make them, in
// right and in wrong orders.

#include "fuzz/library_input.h"
#include "fuzz/saved_work_seeds.h"
#include "library/calmframe.h"

namespace {

using namespace calmframe::fuzz;

std::string Call(LibraryCall call, const std::string& more = "", int session = 0) {
  constexpr int kOther = 128;
  int byte = session == 0 ? 0 : kOther;
  while (byte % static_cast<int>(LibraryCall::count) != static_cast<int>(call)) ++byte;
  return static_cast<char>(byte) + more;
}

std::string OneByte(int byte) {
  return std::string(1, static_cast<char>(byte));
}

OpenInput Frames(int format, int depth, int count) {
  return {.format = format,
          .depth = depth,
          .matrix = 2,
          .chroma_location = 1,
          .aspect_num = 1,
          .aspect_den = 1,
          .rate_num = 25,
          .rate_den = 1,
          .shots = 0,
          .fields = 0,
          .frame_count = count,
          .refuses = -1,
          .starts = {2, 4},
          .width = 32,
          .height = 24,
          .flags = 0,
          .images = 0,
          .unused = {}};
}

std::string Open(const OpenInput& input, int session = 0) {
  return Call(LibraryCall::open, BytesOf(input), session);
}

}  // namespace

int main(int argc, char** argv) {
  using namespace std::string_literals;
  const SeedFolder folder(argc, argv);
  const std::string end =
      Call(LibraryCall::wait, OneByte(200)) + Call(LibraryCall::render, "\0\0"s) +
      Call(LibraryCall::render, "\3\1"s) + Call(LibraryCall::ask, OneByte(130)) +
      Call(LibraryCall::ask, OneByte(134)) + Call(LibraryCall::ask, OneByte(0xf5));
  for (int format = 0; format < 8; ++format) {
    const int depth = format < CALMFRAME_YUV420P ? 8 << format % 3 : 8 + format % 2 * 2;
    folder.Add("pushed_" + std::to_string(format),
               Open(Frames(format, depth, 6)) + Call(LibraryCall::push_some, OneByte(6)) + end);
    OpenInput fetched = Frames(format, depth, 5);
    fetched.flags = kFetches;
    folder.Add("fetched_" + std::to_string(format), Open(fetched) + Call(LibraryCall::start) + end);
  }
  OpenInput listed = Frames(CALMFRAME_RGBA, 8, 6);
  listed.shots = CALMFRAME_SHOTS_LIST;
  listed.flags = kTwoStarts;
  folder.Add("shots", Open(listed) + Call(LibraryCall::push_some, OneByte(6)) + end);
  OpenInput fields = Frames(CALMFRAME_YUV420P, 8, 4);
  fields.fields = 1;
  folder.Add("fields", Open(fields) + Call(LibraryCall::push_some, OneByte(4)) + end);
  folder.Add("fewer", Open(Frames(CALMFRAME_RGB, 8, 9)) + Call(LibraryCall::push_some, OneByte(5)) +
                          Call(LibraryCall::finish) + end);
  folder.Add("saved", Open(Frames(CALMFRAME_RGBA, 8, 5)) + Open(Frames(CALMFRAME_RGBA, 8, 5), 1) +
                          Call(LibraryCall::push_some, OneByte(5)) + end +
                          Call(LibraryCall::save_and_load) + Call(LibraryCall::start, "", 1) +
                          Call(LibraryCall::wait, OneByte(200), 1));
  folder.Add("settings", Open(Frames(CALMFRAME_RGBA, 8, 5)) +
                             Call(LibraryCall::set, "Framing\0Stabilize Only\0"s) +
                             Call(LibraryCall::set, "zoom-speed\0"s + "20\0"s) +
                             Call(LibraryCall::push_some, OneByte(5)) + end);
  folder.Add("cancelled", Open(Frames(CALMFRAME_RGBA, 8, 9)) + Call(LibraryCall::push, "\0\0"s) +
                              Call(LibraryCall::cancel) + Call(LibraryCall::push, "\1\0"s) +
                              Call(LibraryCall::start) + Call(LibraryCall::close) +
                              Call(LibraryCall::start));
  OpenInput same = Frames(CALMFRAME_RGBA, 8, 9);
  same.width = 64;
  same.height = 36;
  same.rate_num = 24000;
  same.rate_den = 1001;
  same.flags = kIdentity;
  AddSavedWork([&](const std::string& name, const std::string& work) {
    folder.Add(name, Open(same) + Call(LibraryCall::load, work));
  });
}
