// Loaded ahead of the program it is what a clip may make of a studio's worker: one whose clip
// is named liar.mp4 says what stands in the file that CALMFRAME_LIES names, once more whenever it
// is told something, and doesn't end by itself. Other processes go on.

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

// What the studio says first, which stays there for the worker.
std::string FirstHead(int socket) {
  std::string heard(1 << 16, '\0');
  while (true) {
    const ssize_t got = recv(socket, heard.data(), heard.size(), MSG_PEEK);
    if (got <= 0) return "";
    std::uint32_t size = 0;
    std::memcpy(&size, heard.data(), sizeof size);
    if (static_cast<std::size_t>(got) >= 8 + size) return heard.substr(8, size);
    usleep(1000);
  }
}

void Say(const char* lies, int socket) {
  const int file = open(lies, O_RDONLY);
  char part[4096];
  for (ssize_t got = 0; (got = read(file, part, sizeof part)) > 0;) {
    for (ssize_t sent = 0, more = 0; sent < got; sent += more) {
      more = write(socket, part + sent, static_cast<std::size_t>(got - sent));
      if (more <= 0) _exit(1);
    }
  }
  close(file);
}

__attribute__((constructor)) void Lie(int argc, char** argv) {
  const char* const lies = std::getenv("CALMFRAME_LIES");
  if (!lies || argc < 3 || std::strcmp(argv[1], "studio-worker") != 0) return;
  const int socket = std::atoi(argv[argc - 1]);
  if (FirstHead(socket).find("/liar.mp4\"") == std::string::npos) return;
  std::signal(SIGTERM, SIG_IGN);
  std::signal(SIGPIPE, SIG_IGN);
  char heard[4096];
  do {
    Say(lies, socket);
  } while (read(socket, heard, sizeof heard) > 0);
  while (true) pause();
}

}  // namespace
