// studio_corpus FOLDER: inputs for studio_fuzz, each a request as the page sends it, or a message.

#include <string>

#include "fuzz/seeds.h"
#include "fuzz/studio_input.h"
#include "studio/wire/message.h"

namespace {

std::string Request(const std::string& line, const std::string& body = "") {
  std::string text =
      line + " HTTP/1.1\r\nHost: 127.0.0.1:1\r\nOrigin: http://127.0.0.1:1\r\nCookie: ";
  text += kSecret;
  if (!body.empty()) {
    text += "\r\nContent-Type: application/json\r\nContent-Length: " + std::to_string(body.size());
  }
  return text + "\r\n\r\n" + body;
}

// With a length that holds once the clip's number, of 12 digits, stands in it.
std::string Do(const std::string& op, const std::string& rest = "") {
  const std::string begin = R"({"op":")" + op + R"(","clip":")", end = "\"" + rest + "}";
  std::string text = Request("POST /api/do", begin + std::string(12, kClip) + end);
  const std::size_t at = text.find(std::string(12, kClip));
  return text.erase(at, 11);
}

}  // namespace

int main(int argc, char** argv) {
  const calmframe::fuzz::SeedFolder folder(argc, argv);
  int count = 0;
  const auto write = [&](std::uint8_t what, const std::string& input) {
    folder.Add(std::to_string(count++), static_cast<char>(what) + input);
  };
  for (const char* line :
       {"GET /", "GET /app.mjs", "GET /api/events", "GET /api/folder?path=%2Ftmp", "HEAD /",
        "GET /?token=00", "GET /api/panel?clip=1",
        "GET /api/frame?clip=1&side=both&frame=3&width=640&v=1"}) {
    write(kOfStranger, Request(line));
  }
  for (const char* op : {"open", "analyze", "cancel", "undo", "redo"}) write(kOfStranger, Do(op));
  write(kOfStranger, Do("control", R"(,"control":16,"value":120)"));
  write(kOfStranger, Do("reset", R"(,"control":16)"));
  write(kOfStranger, Do("window", R"(,"name":"most_zoom","value":1.2)"));
  write(kOfStranger, Do("way", R"(,"way":1)"));
  write(kOfStranger, Do("look", R"(,"frame":7)"));
  write(kOfStranger, Do("save", R"(,"path":"/tmp/a.calm","overwrite":true)"));
  write(kOfStranger, Do("render", R"(,"path":"/tmp/a.mp4","crf":18,"from":"1")"));
  write(kOfStranger, Do("render", R"(,"path":"/tmp/a.mp4","preset":"slow","options":["g=9"])"));
  write(kOfStranger, Do("undo") + Do("redo"));
  write(kOfStranger, Request("POST /login", "password=a%20b"));
  const std::string whole = Do("open");
  write(kOfStranger, whole.substr(0, 30) + kPause + whole.substr(30));
  using calmframe::studio::Encode;
  write(kOfWorker, Encode({{{"id", 1}, {"why", ""}}, "picture"}));
  write(kOfWorker, Encode({{{"tells", {{"state", "ready"}, {"picture", 2}}}}, ""}) +
                       Encode({{{"settings", {{"controls", {{"16", 120}}}}}}, ""}));
}
