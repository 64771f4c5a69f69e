/* Steadies raw frames from the standard input to the standard output, 4:2:0 of 8 bits:

     ffmpeg -i shaky.mp4 -f rawvideo -pix_fmt yuv420p - | ./steady_pipe 1280 720 30 |
       ffmpeg -f rawvideo -pix_fmt yuv420p -s 1280x720 -r 30 -i - steady.mp4

   All frames stay in memory: each is drawn steady when the last one has been seen. */
#include <calmframe.h>
#include <stdio.h>
#include <stdlib.h>

enum { MOST_FRAMES = 10000 }; /* room for their tracks is 8 KiB each */

static calmframe_image ImageOf(unsigned char* pixels, int width, int height) {
  calmframe_image image = {0};
  const size_t luma = (size_t)width * height;
  image.width = width;
  image.height = height;
  image.plane[0] = pixels;
  image.plane[1] = pixels + luma;
  image.plane[2] = pixels + luma + luma / 4;
  image.stride[0] = width;
  image.stride[1] = image.stride[2] = width / 2;
  return image;
}

static void Expect(calmframe_result result, calmframe_session session) {
  char line[512];
  if (result == CALMFRAME_OK) return;
  calmframe_error_text(session, line, sizeof line);
  fprintf(stderr, "steady_pipe: %s\n", line);
  exit(1);
}

int main(int argc, char** argv) {
  const int width = argc > 3 ? atoi(argv[1]) : 0, height = argc > 3 ? atoi(argv[2]) : 0;
  const size_t bytes = (size_t)width * height * 3 / 2;
  static unsigned char* frames[MOST_FRAMES];
  int count = 0;
  calmframe_session session;
  calmframe_options options;
  calmframe_options_init(&options);
  options.width = width;
  options.height = height;
  options.format = CALMFRAME_YUV420P;
  options.rate_num = argc > 3 ? atoi(argv[3]) : 0;
  options.frame_count = MOST_FRAMES; /* at most */
  Expect(calmframe_open(&options, &session), 0);

  for (; count < MOST_FRAMES; ++count) {
    calmframe_image image;
    frames[count] = malloc(bytes);
    if (!frames[count] || fread(frames[count], bytes, 1, stdin) != 1) break;
    image = ImageOf(frames[count], width, height);
    Expect(calmframe_push(session, count, &image), session);
  }
  Expect(calmframe_finish(session), session);
  Expect(calmframe_wait(session, -1), session);

  unsigned char* const drawn = malloc(bytes);
  for (int f = 0; drawn && f < count; ++f) {
    const calmframe_image source = ImageOf(frames[f], width, height);
    const calmframe_image out = ImageOf(drawn, width, height);
    Expect(calmframe_render(session, f, &source, &out), session);
    if (fwrite(drawn, bytes, 1, stdout) != 1) return 1;
  }
  Expect(calmframe_close(session), 0);
  return fflush(stdout) == 0 ? 0 : 1;
}
