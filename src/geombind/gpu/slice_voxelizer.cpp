#include "geombind/gpu/slice_voxelizer.h"

#include <chrono>
#include <cmath>
#include <cstring>
#include <iostream>
#include <string>

#include "geombind/gpu/shader_sources.h"
#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Gpu {

namespace {

using Mat4 = std::array<float, 16>;
using Vec3 = std::array<float, 3>;

double secondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

Vec3 cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
float dot(const Vec3& a, const Vec3& b) { return a[0] * b[0] + a[1] * b[1] + a[2] * b[2]; }
Vec3 normalized(const Vec3& v) {
  const float length = std::sqrt(dot(v, v));
  return {v[0] / length, v[1] / length, v[2] / length};
}

// glOrtho, column-major.
Mat4 ortho(float left, float right, float bottom, float top, float nearZ, float farZ) {
  Mat4 m{};
  m[0] = 2.0f / (right - left);
  m[5] = 2.0f / (top - bottom);
  m[10] = -2.0f / (farZ - nearZ);
  m[12] = -(right + left) / (right - left);
  m[13] = -(top + bottom) / (top - bottom);
  m[14] = -(farZ + nearZ) / (farZ - nearZ);
  m[15] = 1.0f;
  return m;
}

// gluLookAt, column-major.
Mat4 lookAt(const Vec3& eye, const Vec3& target, const Vec3& up) {
  const Vec3 f = normalized({target[0] - eye[0], target[1] - eye[1], target[2] - eye[2]});
  const Vec3 s = normalized(cross(f, up));
  const Vec3 u = cross(s, f);
  Mat4 m{};
  for (int k = 0; k < 3; ++k) {
    m[4 * k + 0] = s[k];
    m[4 * k + 1] = u[k];
    m[4 * k + 2] = -f[k];
  }
  m[12] = -dot(s, eye);
  m[13] = -dot(u, eye);
  m[14] = dot(f, eye);
  m[15] = 1.0f;
  return m;
}

GLint uniform(const ShaderProgram& program, const char* name) {
  return glGetUniformLocation(program.id, name);
}

void upload(const MeshData& mesh, const glm::dvec3& centre, MeshBuffers& buffers) {
  const float c[3] = {static_cast<float>(centre.x), static_cast<float>(centre.y),
                      static_cast<float>(centre.z)};
  std::vector<float> centred;
  centred.reserve(mesh.vertices.size() * 3);
  for (const VertexRecord& v : mesh.vertices) {
    glm::dvec3 p;
    for (int k = 0; k < 3; ++k) {
      const float moved = v.position[k] - c[k];
      centred.push_back(moved);
      p[k] = moved;
    }
    buffers.bounds.extend(p);
  }
  glGenBuffers(1, &buffers.vertexBuffer);
  glBindBuffer(GL_ARRAY_BUFFER, buffers.vertexBuffer);
  glBufferData(GL_ARRAY_BUFFER, static_cast<GLsizeiptr>(centred.size() * sizeof(float)), centred.data(),
               GL_STATIC_DRAW);
  static_assert(sizeof(TriangleRecord) == 3 * sizeof(std::uint32_t), "triangles must be packed indices");
  buffers.indexCount = static_cast<std::uint32_t>(mesh.triangles.size() * 3);
  glGenBuffers(1, &buffers.indexBuffer);
  glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, buffers.indexBuffer);
  glBufferData(GL_ELEMENT_ARRAY_BUFFER, static_cast<GLsizeiptr>(buffers.indexCount * sizeof(std::uint32_t)),
               mesh.triangles.data(), GL_STATIC_DRAW);
  glDisableClientState(GL_VERTEX_ARRAY);
  glBindBuffer(GL_ARRAY_BUFFER, 0);
  glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, 0);
}

}  // namespace

SweepMapping sweepMapping(int axis, bool ascending, const std::array<std::uint32_t, 3>& dims) {
  const std::uint32_t nx = dims[0], ny = dims[1], nz = dims[2];
  const std::uint32_t minus = 0xFFFFFFFFu;  // -1, wrapping
  switch (axis * 2 + (ascending ? 1 : 0)) {
    case 0:  // X, looking toward -x: (nx - 1 - s, v, nz - 1 - u)
      return {{nx - 1, 0, nz - 1}, {0, 0, minus}, {0, 1, 0}, {minus, 0, 0}, 1};
    case 1:  // X, looking toward +x: (s, v, u)
      return {{0, 0, 0}, {0, 0, 1}, {0, 1, 0}, {1, 0, 0}, 2};
    case 2:  // Y, looking toward -y: (nx - 1 - u, ny - 1 - s, v)
      return {{nx - 1, ny - 1, 0}, {minus, 0, 0}, {0, 0, 1}, {0, minus, 0}, 4};
    case 3:  // Y, looking toward +y: (u, s, v)
      return {{0, 0, 0}, {1, 0, 0}, {0, 0, 1}, {0, 1, 0}, 8};
    case 4:  // Z, looking toward -z: (u, v, nz - 1 - s)
      return {{0, 0, nz - 1}, {1, 0, 0}, {0, 1, 0}, {0, 0, minus}, 16};
    default:  // Z, looking toward +z: (nx - 1 - u, v, s)
      return {{nx - 1, 0, 0}, {minus, 0, 0}, {0, 1, 0}, {0, 0, 1}, 32};
  }
}

AccumulatorBit accumulatorBit(std::uint32_t k) {
  return {static_cast<std::int32_t>((k % 32) / 8), static_cast<float>(1u << (k % 8)) / 255.0f};
}

ShaderSources builtinShaders() {
  return {kVSSlicerSource, kVSAccumulatorSource, kFSSlicerSource, kFSAccumulatorSource};
}

bool SliceVoxelizer::createPrograms(const ShaderSources& shaders) {
  // All six are attempted so every problem is reported at once.
  bool ok = library.createShader("VSSlicer", GL_VERTEX_SHADER, shaders.vsSlicer);
  ok = library.createShader("VSAccumulator", GL_VERTEX_SHADER, shaders.vsAccumulator) && ok;
  ok = library.createShader("FSSlicer", GL_FRAGMENT_SHADER, shaders.fsSlicer) && ok;
  ok = library.createShader("FSAccumulator", GL_FRAGMENT_SHADER, shaders.fsAccumulator) && ok;
  ok = library.createProgram("slicer", {"VSSlicer", "FSSlicer"}) && ok;
  ok = library.createProgram("accumulator", {"VSAccumulator", "FSAccumulator"}) && ok;
  return ok;
}

void SliceVoxelizer::resizeTargets(std::uint32_t width, std::uint32_t height) {
  if (framebuffer.id != 0 && framebuffer.width == width && framebuffer.height == height) return;
  framebuffer.create(width, height);
  const GLenum formats[3] = {GL_RGBA8, GL_RGBA8, GL_R8};
  for (std::uint32_t i = 0; i < 3; ++i) {
    textures[i].create(formats[i], width, height, nullptr);
    // Bits are read per texel; any filtering would blend neighbouring voxels.
    textures[i].setParameter(GL_TEXTURE_MAG_FILTER, GL_NEAREST);
    textures[i].setParameter(GL_TEXTURE_MIN_FILTER, GL_NEAREST);
    framebuffer.attachColor(i, textures[i]);
  }
  depth.create(GL_DEPTH_COMPONENT, width, height);
  framebuffer.attachDepth(depth);
  readbackBuffer.resize(static_cast<std::size_t>(width) * height * 4);
}

void SliceVoxelizer::clearAccumulator() {
  framebuffer.bind(currentAccumulator);
  glClear(GL_COLOR_BUFFER_BIT | GL_DEPTH_BUFFER_BIT);
  framebuffer.unbind();
  pendingSlices = 0;
}

void SliceVoxelizer::renderSlice(std::uint32_t s,
                                 const float* view,
                                 const float* projection,
                                 const MeshBuffers& mesh) {
  const ShaderProgram& slicer = *library.getProgram("slicer");
  glUseProgram(slicer.id);
  glUniformMatrix4fv(uniform(slicer, "uView"), 1, GL_FALSE, view);
  glUniformMatrix4fv(uniform(slicer, "uProjection"), 1, GL_FALSE, projection);

  // Back faces write 1, front faces 0; the depth test keeps the nearest surface, so a pixel reads 1
  // exactly when the slice point sees the inside of a surface first.
  framebuffer.bind(2);
  glClear(GL_COLOR_BUFFER_BIT | GL_DEPTH_BUFFER_BIT);
  glCullFace(GL_FRONT);
  glDrawElements(GL_TRIANGLES, static_cast<GLsizei>(mesh.indexCount), GL_UNSIGNED_INT, nullptr);
  glCullFace(GL_BACK);
  glDrawElements(GL_TRIANGLES, static_cast<GLsizei>(mesh.indexCount), GL_UNSIGNED_INT, nullptr);
  framebuffer.unbind();
  glDisable(GL_DEPTH_TEST);

  const std::uint32_t k = pendingSlices;
  const ShaderProgram& accumulator = *library.getProgram("accumulator");
  glUseProgram(accumulator.id);
  glUniform1i(uniform(accumulator, "uTexAccum"), 0);
  glUniform1i(uniform(accumulator, "uTexSlice"), 1);
  const AccumulatorBit bit = accumulatorBit(k);
  glUniform1f(uniform(accumulator, "uBitValue"), bit.bitValue);
  glUniform1i(uniform(accumulator, "uComponent"), bit.component);

  framebuffer.bind(1 - currentAccumulator);
  textures[currentAccumulator].bind(0);
  textures[2].bind(1);
  glBegin(GL_QUADS);
  glTexCoord2i(0, 0);
  glVertex2i(-1, -1);
  glTexCoord2i(1, 0);
  glVertex2i(1, -1);
  glTexCoord2i(1, 1);
  glVertex2i(1, 1);
  glTexCoord2i(0, 1);
  glVertex2i(-1, 1);
  glEnd();
  textures[2].unbind(1);
  textures[currentAccumulator].unbind(0);
  framebuffer.unbind();
  glUseProgram(0);
  currentAccumulator = 1 - currentAccumulator;
  glEnable(GL_DEPTH_TEST);

  sliceIndices[k] = s;
  pendingSlices = k + 1;
}

void SliceVoxelizer::flushSlices(const SweepMapping& mapping, AxisVoteGrid& votes) {
  if (pendingSlices == 0) return;
  std::chrono::steady_clock::time_point start;
  if (timings != nullptr) {
    glFinish();
    start = std::chrono::steady_clock::now();
  }
  textures[currentAccumulator].bind(0);
  glGetTexImage(GL_TEXTURE_2D, 0, GL_RGBA, GL_UNSIGNED_BYTE, readbackBuffer.data());
  textures[currentAccumulator].unbind(0);

  const std::int64_t width = framebuffer.width;
  const std::int64_t height = framebuffer.height;
  const std::uint32_t nx = votes.dims[0], ny = votes.dims[1];
  const std::uint32_t pending = pendingSlices;
  const std::uint8_t* texels = readbackBuffer.data();
  std::uint8_t* grid = votes.votes.data();
  const std::uint32_t* slices = sliceIndices;
  // Each texel and bit maps to its own voxel, so the rows can be unpacked side by side.
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t v = 0; v < height; ++v) {
    for (std::int64_t u = 0; u < width; ++u) {
      const std::uint8_t* t = texels + (v * width + u) * 4;
      const std::uint32_t w = std::uint32_t{t[0]} | std::uint32_t{t[1]} << 8 | std::uint32_t{t[2]} << 16 |
                              std::uint32_t{t[3]} << 24;
      if (w == 0) continue;
      for (std::uint32_t k = 0; k < pending; ++k) {
        if (((w >> k) & 1u) == 0) continue;
        std::uint32_t voxel[3];
        for (int a = 0; a < 3; ++a) {
          voxel[a] = mapping.origin[a] + static_cast<std::uint32_t>(u) * mapping.uDir[a] +
                     static_cast<std::uint32_t>(v) * mapping.vDir[a] + slices[k] * mapping.sliceDir[a];
        }
        grid[(std::uint64_t{voxel[2]} * ny + voxel[1]) * nx + voxel[0]] |= mapping.flag;
      }
    }
  }
  clearAccumulator();
  if (timings != nullptr) timings->readbackSeconds += secondsSince(start);
}

void SliceVoxelizer::sliceAxis(int axis,
                               const Collision::AABB& box,
                               const MeshBuffers& mesh,
                               AxisVoteGrid& votes) {
  const std::uint32_t nx = votes.dims[0], ny = votes.dims[1], nz = votes.dims[2];
  const std::uint32_t size[3][2] = {{nz, ny}, {nx, nz}, {nx, ny}};
  resizeTargets(size[axis][0], size[axis][1]);
  clearAccumulator();

  const Vec3 lower = {static_cast<float>(box.lower.x), static_cast<float>(box.lower.y),
                      static_cast<float>(box.lower.z)};
  const Vec3 upper = {static_cast<float>(box.upper.x), static_cast<float>(box.upper.y),
                      static_cast<float>(box.upper.z)};
  const std::uint32_t n = votes.dims[axis];
  const float extent = upper[axis] - lower[axis];
  const float step = extent / static_cast<float>(n);
  const Vec3 up = axis == 1 ? Vec3{0, 0, 1} : Vec3{0, 1, 0};

  for (const bool ascending : {false, true}) {
    // Ortho left/right/bottom/top per sweep: the image's u axis runs along the voxel mapping's u.
    Mat4 projection;
    if (axis == 0) {
      projection = ascending ? ortho(lower[2], upper[2], lower[1], upper[1], 0.0f, extent)
                             : ortho(-upper[2], -lower[2], lower[1], upper[1], 0.0f, extent);
    } else if (axis == 1) {
      projection = ascending ? ortho(lower[0], upper[0], lower[2], upper[2], 0.0f, extent)
                             : ortho(-upper[0], -lower[0], lower[2], upper[2], 0.0f, extent);
    } else {
      projection = ascending ? ortho(-upper[0], -lower[0], lower[1], upper[1], 0.0f, extent)
                             : ortho(lower[0], upper[0], lower[1], upper[1], 0.0f, extent);
    }
    Vec3 target{0, 0, 0};
    target[axis] = ascending ? upper[axis] + 0.0001f : lower[axis] - 0.0001f;
    const SweepMapping mapping = sweepMapping(axis, ascending, votes.dims);

    float position = ascending ? lower[axis] : upper[axis];
    for (std::uint32_t s = 0; s < n; ++s) {
      position = ascending ? position + step : position - step;
      // Slices beyond the mesh would only ever see empty space.
      const double at = position;
      if (at < mesh.bounds.lower[axis] || at > mesh.bounds.upper[axis]) continue;
      Vec3 eye{0, 0, 0};
      eye[axis] = position;
      const Mat4 view = lookAt(eye, target, up);
      renderSlice(s, view.data(), projection.data(), mesh);
      if (pendingSlices == 32) flushSlices(mapping, votes);
    }
    flushSlices(mapping, votes);
  }
}

bool castAxisVotes(const MeshData& mesh,
                   AxisVoteGrid& votes,
                   const ShaderSources& shaders,
                   SweepTimings* timings) {
  // No GL library, no sweeps: report it as the shader library reports its failures.
  if (std::string why; !GL::load(&why)) {
    std::cerr << "voxelizer: " << why << "\n";
    return false;
  }
  SliceVoxelizer voxelizer;
  if (!voxelizer.createPrograms(shaders)) return false;
  voxelizer.timings = timings;
  const auto start = std::chrono::steady_clock::now();
  const double readbackBefore = timings != nullptr ? timings->readbackSeconds : 0.0;
  const glm::dvec3 centre = (mesh.boundingBox.lower + mesh.boundingBox.upper) * 0.5;
  const Collision::AABB box(mesh.boundingBox.lower - centre, mesh.boundingBox.upper - centre);

  glEnable(GL_CULL_FACE);
  GLfloat savedClearColor[4];
  glGetFloatv(GL_COLOR_CLEAR_VALUE, savedClearColor);
  glClearColor(0.0f, 0.0f, 0.0f, 0.0f);
  glEnable(GL_DEPTH_TEST);

  MeshBuffers buffers;
  upload(mesh, centre, buffers);
  glEnableClientState(GL_VERTEX_ARRAY);
  glBindBuffer(GL_ARRAY_BUFFER, buffers.vertexBuffer);
  glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, buffers.indexBuffer);
  glVertexPointer(3, GL_FLOAT, 0, nullptr);
  for (int axis = 0; axis < 3; ++axis) voxelizer.sliceAxis(axis, box, buffers, votes);
  glDisableClientState(GL_VERTEX_ARRAY);
  glBindBuffer(GL_ARRAY_BUFFER, 0);
  glBindBuffer(GL_ELEMENT_ARRAY_BUFFER, 0);
  glClearColor(savedClearColor[0], savedClearColor[1], savedClearColor[2], savedClearColor[3]);
  glDisable(GL_CULL_FACE);
  glDeleteBuffers(1, &buffers.vertexBuffer);
  glDeleteBuffers(1, &buffers.indexBuffer);
  if (timings != nullptr) {
    glFinish();
    timings->renderSeconds += secondsSince(start) - (timings->readbackSeconds - readbackBefore);
  }
  return true;
}

void voxelizeInterior(IProgress& progress,
                      const MeshData& mesh,
                      VoxelBitGrid& grid,
                      bool refineInterior,
                      float windingThreshold) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return;
  AxisVoteGrid votes{grid.dims, std::vector<std::uint8_t>(static_cast<std::size_t>(grid.cellCount()), 0)};
  // The GL objects are gone before classification starts; only the vote bytes are needed from here on.
  if (!castAxisVotes(mesh, votes)) return;
  settleVotes(progress, mesh, votes, grid, refineInterior, windingThreshold);
}

}  // namespace TessikSDK::GeomBind::Gpu
