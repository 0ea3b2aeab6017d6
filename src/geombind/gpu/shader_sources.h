#pragma once

// The voxelizer's GLSL sources, embedded at build time from shaders/*.glsl. Each is the file's exact
// text: every line, the last included, ends in a line feed.
namespace TessikSDK::GeomBind::Gpu {

extern const char* const kVSSlicerSource;
extern const char* const kVSAccumulatorSource;
extern const char* const kFSSlicerSource;
extern const char* const kFSAccumulatorSource;

}  // namespace TessikSDK::GeomBind::Gpu
