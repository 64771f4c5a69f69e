#include <GLES3/gl3.h>

#include <cstddef>
#include <stdexcept>

#include "examples/outside_renderer/drawing/frame_drawer.h"
#include "examples/outside_renderer/drawing/gl_display.h"

namespace outside {
namespace {

// Two triangles a cell. Row 0 of the target is the picture's top row.
constexpr char kVertexShader[] = R"(#version 300 es
layout(location = 0) in vec4 x;
layout(location = 1) in vec4 y;
layout(location = 2) in vec3 row0;
layout(location = 3) in vec3 row1;
layout(location = 4) in vec3 row2;
layout(location = 5) in ivec4 origins;
uniform vec2 target;
flat out vec3 source_x;
flat out vec3 source_y;
flat out vec3 weight;
flat out ivec4 origin;
const int corners[6] = int[6](0, 1, 2, 0, 2, 3);
void main() {
  int k = corners[gl_VertexID];
  gl_Position = vec4((vec2(x[k], y[k]) + 0.5) * 2.0 / target - 1.0, 0.0, 1.0);
  source_x = row0;
  source_y = row1;
  weight = row2;
  origin = origins;
}
)";

// The sampler's own filter has too few steps between two pixels and knows no straight alpha, so the
// four neighbours are mixed here. Pixels are alpha, red, green, blue.
constexpr char kFragmentShader[] = R"(#version 300 es
precision highp float;
precision highp int;
precision highp usampler2D;
uniform usampler2D source;
flat in vec3 source_x;
flat in vec3 source_y;
flat in vec3 weight;
flat in ivec4 origin;
layout(location = 0) out vec4 colour;
vec4 between(vec4 p, vec4 q, float t) {
  float s = 1.0 - t;
  if (p.x == q.x) return p.x == 0.0 ? vec4(0.0) : floor(p * s + q * t + 0.5);
  float wp = p.x * s;
  float wq = q.x * t;
  float alpha = wp + wq;
  if (alpha == 0.0) return vec4(0.0);
  return floor(vec4(alpha, (p.yzw * wp + q.yzw * wq) / alpha) + 0.5);
}
vec4 pixel(ivec2 at) {
  return vec4(texelFetch(source, at, 0));
}
void main() {
  vec3 at = vec3(ivec2(gl_FragCoord.xy) - origin.xy, 1.0);
  ivec2 size = textureSize(source, 0);
  vec2 low = 0.0001 - vec2(origin.zw);
  vec2 high = vec2(size - 1 - origin.zw) - 0.0001;
  vec2 place = clamp(vec2(dot(source_x, at), dot(source_y, at)) / dot(weight, at), low, high);
  vec2 whole = floor(place);
  vec2 t = place - whole;
  ivec2 i = clamp(ivec2(whole) + origin.zw, ivec2(0), size - 2);
  colour = between(between(pixel(i), pixel(i + ivec2(0, 1)), t.y),
                   between(pixel(i + ivec2(1, 0)), pixel(i + ivec2(1, 1)), t.y), t.x) / 255.0;
}
)";

GLuint Compile(GLenum kind, const char* text) {
  const GLuint shader = glCreateShader(kind);
  glShaderSource(shader, 1, &text, nullptr);
  glCompileShader(shader);
  GLint compiled = 0;
  glGetShaderiv(shader, GL_COMPILE_STATUS, &compiled);
  if (compiled) return shader;
  char log[512] = "";
  glGetShaderInfoLog(shader, sizeof log, nullptr, log);
  throw std::runtime_error(std::string("a shader was refused: ") + log);
}

// What it makes goes with its context.
class GlDrawer final : public FrameDrawer {
 public:
  GlDrawer() {
    program_ = glCreateProgram();
    glAttachShader(program_, Compile(GL_VERTEX_SHADER, kVertexShader));
    glAttachShader(program_, Compile(GL_FRAGMENT_SHADER, kFragmentShader));
    glLinkProgram(program_);
    GLint linked = 0;
    glGetProgramiv(program_, GL_LINK_STATUS, &linked);
    if (!linked) throw std::runtime_error("the shaders don't link");
    glUseProgram(program_);
    glUniform1i(glGetUniformLocation(program_, "source"), 0);

    glGenTextures(1, &texture_);
    glBindTexture(GL_TEXTURE_2D, texture_);
    glTexParameteri(GL_TEXTURE_2D, GL_TEXTURE_MIN_FILTER, GL_NEAREST);
    glTexParameteri(GL_TEXTURE_2D, GL_TEXTURE_MAG_FILTER, GL_NEAREST);
    glPixelStorei(GL_UNPACK_ALIGNMENT, 4);

    GLuint framebuffer = 0;
    glGenFramebuffers(1, &framebuffer);
    glBindFramebuffer(GL_FRAMEBUFFER, framebuffer);
    glGenRenderbuffers(1, &target_);
    glBindRenderbuffer(GL_RENDERBUFFER, target_);
    glGetIntegerv(GL_MAX_RENDERBUFFER_SIZE, &largest_);

    GLuint vertices = 0, array = 0;
    glGenVertexArrays(1, &array);
    glBindVertexArray(array);
    glGenBuffers(1, &vertices);
    glBindBuffer(GL_ARRAY_BUFFER, vertices);
    Attribute(0, 4, offsetof(Cell, x));
    Attribute(1, 4, offsetof(Cell, y));
    for (GLuint row = 0; row < 3; ++row) {
      Attribute(2 + row, 3, offsetof(Cell, source_from_output) + row * 3 * sizeof(float));
    }
    static_assert(offsetof(Cell, source_origin) ==
                  offsetof(Cell, output_origin) + 2 * sizeof(std::int32_t));
    glEnableVertexAttribArray(5);
    glVertexAttribIPointer(5, 4, GL_INT, sizeof(Cell),
                           reinterpret_cast<const void*>(offsetof(Cell, output_origin)));
    glVertexAttribDivisor(5, 1);

    glEnable(GL_SCISSOR_TEST);
    glEnable(GL_CULL_FACE);  // a cell that is folded over shows nothing
    glDisable(GL_DITHER);
  }

  std::string name() const override {
    return reinterpret_cast<const char*>(glGetString(GL_RENDERER));
  }

  void Draw(const FrameMesh& mesh, const SourceView& source, Picture& output) override {
    output.width = mesh.width;
    output.height = mesh.height;
    output.pixels.resize(static_cast<std::size_t>(mesh.width) *
                         static_cast<std::size_t>(mesh.height));
    if (output.pixels.empty()) return;
    SetTarget(mesh.width, mesh.height);
    SetSource(source);
    glDisable(GL_SCISSOR_TEST);
    glClear(GL_COLOR_BUFFER_BIT);
    glEnable(GL_SCISSOR_TEST);
    if (mesh.left < mesh.right && mesh.top < mesh.bottom && !mesh.cells.empty()) {
      glScissor(mesh.left, mesh.top, mesh.right - mesh.left, mesh.bottom - mesh.top);
      glBufferData(GL_ARRAY_BUFFER, static_cast<GLsizeiptr>(mesh.cells.size() * sizeof(Cell)),
                   mesh.cells.data(), GL_STREAM_DRAW);
      glDrawArraysInstanced(GL_TRIANGLES, 0, 6, static_cast<GLsizei>(mesh.cells.size()));
    }
    glReadPixels(0, 0, mesh.width, mesh.height, GL_RGBA, GL_UNSIGNED_BYTE, output.pixels.data());
    if (const GLenum error = glGetError(); error != GL_NO_ERROR) {
      throw std::runtime_error("OpenGL error " + std::to_string(error));
    }
  }

 private:
  static void Attribute(GLuint place, GLint count, std::size_t offset) {
    glEnableVertexAttribArray(place);
    glVertexAttribPointer(place, count, GL_FLOAT, GL_FALSE, sizeof(Cell),
                          reinterpret_cast<const void*>(offset));
    glVertexAttribDivisor(place, 1);
  }

  void SetTarget(std::int32_t width, std::int32_t height) {
    if (width == width_ && height == height_) return;
    if (width > largest_ || height > largest_) {
      throw std::runtime_error(std::to_string(width) + " by " + std::to_string(height) +
                               " pixels are more than this OpenGL draws");
    }
    glRenderbufferStorage(GL_RENDERBUFFER, GL_RGBA8, width, height);
    glFramebufferRenderbuffer(GL_FRAMEBUFFER, GL_COLOR_ATTACHMENT0, GL_RENDERBUFFER, target_);
    if (glCheckFramebufferStatus(GL_FRAMEBUFFER) != GL_FRAMEBUFFER_COMPLETE) {
      throw std::runtime_error("this OpenGL gives no frame buffer");
    }
    glViewport(0, 0, width, height);
    glUniform2f(glGetUniformLocation(program_, "target"), static_cast<float>(width),
                static_cast<float>(height));
    width_ = width;
    height_ = height;
  }

  void SetSource(const SourceView& source) {
    glPixelStorei(GL_UNPACK_ROW_LENGTH,
                  static_cast<GLint>(source.row_bytes / std::ptrdiff_t{sizeof(HX_Pixel8)}));
    if (source.width != source_width_ || source.height != source_height_) {
      glTexImage2D(GL_TEXTURE_2D, 0, GL_RGBA8UI, source.width, source.height, 0, GL_RGBA_INTEGER,
                   GL_UNSIGNED_BYTE, source.pixels);
      source_width_ = source.width;
      source_height_ = source.height;
    } else {
      glTexSubImage2D(GL_TEXTURE_2D, 0, 0, 0, source.width, source.height, GL_RGBA_INTEGER,
                      GL_UNSIGNED_BYTE, source.pixels);
    }
  }

  const GlDisplay display_;
  GLuint program_ = 0, texture_ = 0, target_ = 0;
  GLint largest_ = 0;
  std::int32_t width_ = 0, height_ = 0, source_width_ = 0, source_height_ = 0;
};

}  // namespace

std::unique_ptr<FrameDrawer> MakeGlDrawer() {
  return std::make_unique<GlDrawer>();
}

}  // namespace outside
