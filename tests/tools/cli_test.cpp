// Runs the built tessik-bind as a user would: exit statuses, messages, and which files appear.

#include <algorithm>
#include <array>
#include <cctype>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>

#include <gtest/gtest.h>

#include "tool_outputs.h"
#include "tool_process.h"

namespace tessik::test {
namespace {

namespace fs = std::filesystem;

struct Box {
  std::array<float, 3> centre;
  float half;
};

// Closed cubes, one after another in one OBJ, each split along its face
// seams as exporters write them (a normal per face).
std::string boxesObj(const std::vector<Box>& boxes) {
  std::ostringstream obj;
  obj << "vn 0 0 -1\nvn 0 0 1\nvn 0 -1 0\nvn 0 1 0\nvn -1 0 0\nvn 1 0 0\n";
  int base = 0;
  for (const Box& b : boxes) {
    for (int i = 0; i < 8; ++i)
      obj << "v " << b.centre[0] + ((i & 1) != 0 ? b.half : -b.half) << " "
          << b.centre[1] + ((i & 2) != 0 ? b.half : -b.half) << " "
          << b.centre[2] + ((i & 4) != 0 ? b.half : -b.half) << "\n";
    const int faces[6][4] = {{1, 3, 4, 2}, {5, 6, 8, 7}, {1, 2, 6, 5},
                             {3, 7, 8, 4}, {1, 5, 7, 3}, {2, 4, 8, 6}};
    for (int f = 0; f < 6; ++f) {
      obj << "f";
      for (int c : faces[f]) obj << " " << base + c << "//" << f + 1;
      obj << "\n";
    }
    base += 8;
  }
  return obj.str();
}

constexpr const char* kBoxBones =
    R"([{"name": "base", "position": [0, -0.5, 0]}, {"name": "top", "parent": "base", "position": [0, 0.5, 0]}])";

class CliTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("tessik_cli_" + std::to_string(::getpid()));
    fs::create_directories(dir_);
    write("box.obj", boxesObj({{{0.0f, 0.0f, 0.0f}, 1.0f}}));
    write("bones.json", kBoxBones);
  }
  void TearDown() override { fs::remove_all(dir_); }

  void write(const std::string& name, const std::string& text) { std::ofstream(dir_ / name) << text; }
  ProcessResult run(const std::vector<std::string>& args, const std::string& interruptAfter = {}) {
    return runTool(TESSIK_BIND_EXE, args, dir_.string(), interruptAfter);
  }
  std::set<std::string> files() const {
    std::set<std::string> names;
    for (const auto& e : fs::recursive_directory_iterator(dir_))
      names.insert(fs::relative(e.path(), dir_).string());
    return names;
  }
  static std::string model(const char* relative) {
    return std::string(TESSIK_ASSIMP_MODELS) + "/" + relative;
  }

  fs::path dir_;
};

struct RealAsset {
  const char* file;
  const char* method;
  std::size_t bones;
};

class RealAssetTest : public CliTest, public ::testing::WithParamInterface<RealAsset> {};

TEST_P(RealAssetTest, BindsWritesAndDraws) {
  const RealAsset a = GetParam();
  const ProcessResult r = run({model(a.file), "--method", a.method, "-o", "out.glb", "--csv", "w.csv",
                               "--preview", "out.png", "--preview-size", "160"});
  ASSERT_EQ(r.status, 0) << r.err;
  EXPECT_NE(r.out.find(std::string("method      ") + a.method), std::string::npos) << r.out;
  EXPECT_EQ(r.out.find("Total (s)"), std::string::npos)
      << "the library's stage table shows only with --verbose";
  expectConsistentSkin((dir_ / "out.glb").string(), a.bones);
  const Picture png = loadPng((dir_ / "out.png").string());
  EXPECT_EQ(png.width, 160);
  EXPECT_EQ(png.height, 160);
  EXPECT_GT(png.distinctColours(), 20u);
  std::ifstream csv(dir_ / "w.csv");
  std::string header;
  std::getline(csv, header);
  EXPECT_EQ(header, "vertex,bone,weight");
  EXPECT_EQ(files(), (std::set<std::string>{"bones.json", "box.obj", "out.glb", "out.png", "w.csv"}));
}

INSTANTIATE_TEST_SUITE_P(Characters,
                         RealAssetTest,
                         ::testing::Values(RealAsset{"X/Testwuson.X", "geodesic", 37},
                                           RealAsset{"X/BCN_Epileptic.X", "heatmap", 54},
                                           RealAsset{"FBX/animation_with_skeleton.fbx", "geodesic", 14},
                                           RealAsset{"FBX/animation_with_skeleton.fbx", "heatmap", 14},
                                           RealAsset{"X/BCN_Epileptic.X", "geodesic", 54}),
                         [](const ::testing::TestParamInfo<RealAsset>& info) {
                           std::string name =
                               fs::path(info.param.file).stem().string() + "_" + info.param.method;
                           std::replace_if(
                               name.begin(), name.end(), [](char c) { return !std::isalnum(c); }, '_');
                           return name;
                         });

TEST_F(CliTest, ObjWithSkeletonFileKeepsItsSeamVertices) {
  const ProcessResult r =
      run({"box.obj", "--skeleton", "bones.json", "-o", "box.gltf", "--method", "heatmap"});
  ASSERT_EQ(r.status, 0) << r.err;
  EXPECT_NE(r.out.find("(8 after welding seams)"), std::string::npos) << r.out;
  EXPECT_NE(r.out.find("  leaf tips   "), std::string::npos) << r.out;
  expectConsistentSkin((dir_ / "box.gltf").string(), 2);
  EXPECT_EQ(readSkinnedGltf((dir_ / "box.gltf").string()).vertices, 24u);
}

struct BadRun {
  std::vector<std::string> args;
  const char* message;
};

class BadRunTest : public CliTest, public ::testing::WithParamInterface<BadRun> {};

TEST_P(BadRunTest, SaysWhyAndLeavesExistingFilesAlone) {
  write("bad.json", "[{\"name\": \"a\", \"position\": [0, 0");
  write("orphan.json", R"([{"name": "a", "parent": "nobody", "position": [0, 0, 0]}])");
  write("garbage.fbx", "not an fbx file\n");
  write("outside.json", R"([{"name": "away", "position": [5, 0, 0]}])");
  write("lines.obj", "v 0 0 0\nv 1 0 0\nv 0 1 0\nl 1 2 3\n");
  write("out.glb", "precious");
  const std::set<std::string> before = files();
  const ProcessResult r = run(GetParam().args);
  EXPECT_NE(r.status, 0);
  EXPECT_NE(r.err.find(GetParam().message), std::string::npos) << r.err;
  EXPECT_EQ(files(), before);
  std::ifstream kept(dir_ / "out.glb");
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(kept), {}), "precious");
}

INSTANTIATE_TEST_SUITE_P(
    Inputs,
    BadRunTest,
    ::testing::Values(
        BadRun{{"missing.fbx", "-o", "out.glb"}, "No such file"},
        BadRun{{"garbage.fbx", "-o", "out.glb"}, "cannot import"},
        BadRun{{"box.obj", "-o", "out.glb"}, "has no skeleton"},
        BadRun{{"lines.obj", "--skeleton", "bones.json", "-o", "out.glb"}, "no triangles"},
        BadRun{{"box.obj", "--skeleton", "bad.json", "-o", "out.glb"}, "not valid JSON"},
        BadRun{{"box.obj", "--skeleton", "orphan.json", "-o", "out.glb"}, "unknown parent 'nobody'"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "-o", "out.glb", "--pose", "elbow=0,0,10"}, "elbow"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "--pose", "top=0,x,10", "-o", "out.glb"},
               "top=0,x,10"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "-o", "out.obj"}, ".glb or .gltf"},
        BadRun{{"box.obj", "--skeleton", "bones.json"}, "nothing to write"},
        BadRun{{"box.obj", "-o", "out.glb", "--resolution", "4"}, "--resolution"},
        BadRun{{"box.obj", "-o", "out.glb", "--falloff", "1.5"}, "--falloff"},
        BadRun{{"box.obj", "-o", "out.glb", "--method", "magic"}, "--method"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "--csv", "box.obj"}, "would overwrite the input"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "--csv", "./bones.json"},
               "would overwrite the skeleton"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "-o", "new.glb", "--csv", "new.glb"}, "both name"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "-o", "out.glb", "--csv", "out.glb"}, "both name"},
        BadRun{{"box.obj", "--skeleton", "bones.json", "--csv", "/dev/null"}, "is not a regular file"},
        BadRun{{"box.obj", "--skeleton", "outside.json", "-o", "out.glb"}, "no joint lies within the mesh"}));

// Bad options are usage errors: status 2 and one line naming the option, whichever check catches them.
TEST_F(CliTest, BadOptionsExitTwoWithOneLine) {
  const std::vector<std::vector<std::string>> cases = {{"--resolution", "4"}, {"--falloff", "1.5"},
                                                       {"--method", "magic"}, {"--voxelizer", "opengl"},
                                                       {"--no-such-option"},  {"--preview-size", "x"}};
  for (const std::vector<std::string>& bad : cases) {
    std::vector<std::string> args = {"box.obj", "--skeleton", "bones.json", "-o", "out.glb"};
    args.insert(args.end(), bad.begin(), bad.end());
    const ProcessResult r = run(args);
    EXPECT_EQ(r.status, 2) << bad[0] << ": " << r.err;
    EXPECT_EQ(r.err.rfind("tessik-bind: ", 0), 0u) << r.err;
    EXPECT_EQ(std::count(r.err.begin(), r.err.end(), '\n'), 1) << r.err;
    EXPECT_NE(r.err.find(bad[0]), std::string::npos) << r.err;
  }
}

// Machines without OpenGL: no EGL driver (a vendor list naming none leaves libglvnd nothing to load, as
// on a bare server), or no GL library at all (the shim makes every dlopen of one fail). The processor
// binds and draws unless the GPU is demanded.
struct NoGLRun {
  const char* name;
  std::vector<std::string> environment;
  std::vector<std::string> args;
  int status;
  const char* says;  // on stdout when the run succeeds, at the start of stderr when it fails
};

const std::string kNoEglDriver = "__EGL_VENDOR_LIBRARY_FILENAMES=/nonexistent/vendor.json";
// ASan wants to come first among the preloaded libraries; the shim cannot, in a sanitised build.
const std::vector<std::string> kNoGLLibrary = {std::string("LD_PRELOAD=") + TESSIK_NO_GL_SHIM,
                                               "ASAN_OPTIONS=verify_asan_link_order=0:detect_leaks=0"};

class NoOpenGLTest : public CliTest, public ::testing::WithParamInterface<NoGLRun> {};

TEST_P(NoOpenGLTest, BindsAndDrawsOnTheProcessorUnlessTheGpuIsDemanded) {
  const NoGLRun& c = GetParam();
  std::vector<std::string> args = c.args;
  for (const char* more : {"-o", "c.glb", "--preview", "c.png"}) args.push_back(more);
  const ProcessResult r = runTool(TESSIK_BIND_EXE, args, dir_.string(), {}, c.environment);
  EXPECT_EQ(r.status, c.status) << r.err;
  if (c.status == 0) {
    EXPECT_NE(r.out.find(c.says), std::string::npos) << r.out;
    EXPECT_EQ(files(), (std::set<std::string>{"bones.json", "box.obj", "c.glb", "c.png"}));
  } else {
    EXPECT_EQ(r.err.rfind(c.says, 0), 0u) << r.err;
    EXPECT_NE(r.err.find("libegl-mesa0"), std::string::npos) << r.err;
    EXPECT_EQ(files(), (std::set<std::string>{"bones.json", "box.obj"}));
  }
}

INSTANTIATE_TEST_SUITE_P(
    Machines,
    NoOpenGLTest,
    ::testing::Values(
        NoGLRun{"NoEglDriver",
                {kNoEglDriver},
                {"box.obj", "--skeleton", "bones.json"},
                0,
                "voxelised on the CPU"},
        NoGLRun{
            "NoGLLibrary", kNoGLLibrary, {"box.obj", "--skeleton", "bones.json"}, 0, "voxelised on the CPU"},
        NoGLRun{"NoGLLibraryHeat",
                kNoGLLibrary,
                {"box.obj", "--skeleton", "bones.json", "--method", "heatmap"},
                0,
                "method      heatmap"},
        NoGLRun{"GpuDemanded",
                {kNoEglDriver},
                {"box.obj", "--skeleton", "bones.json", "--voxelizer", "gpu"},
                1,
                "tessik-bind: --voxelizer gpu needs OpenGL"}),
    [](const ::testing::TestParamInfo<NoGLRun>& info) { return std::string(info.param.name); });

// A file-size limit makes the writes fail: the run says so, exits 1 and leaves neither temporaries nor
// changed files.
TEST_F(CliTest, WritesPastAFileSizeLimitFailCleanly) {
  write("out.glb", "precious");
  const std::set<std::string> before = files();
  const ProcessResult r = runTool("/bin/sh",
                                  {"-c", "ulimit -f 4; exec \"$0\" \"$@\"", TESSIK_BIND_EXE, "box.obj",
                                   "--skeleton", "bones.json", "-o", "out.glb", "--preview", "p.png"},
                                  dir_.string());
  EXPECT_EQ(r.status, 1) << r.err;
  EXPECT_NE(r.err.find("cannot write"), std::string::npos) << r.err;
  EXPECT_EQ(r.out.find("wrote"), std::string::npos) << r.out;
  EXPECT_EQ(files(), before);
  std::ifstream kept(dir_ / "out.glb");
  EXPECT_EQ(std::string(std::istreambuf_iterator<char>(kept), {}), "precious");
}

// The processor's voxelizer and every later stage give the same weights whatever the worker count.
TEST_F(CliTest, CpuWeightsDoNotDependOnTheThreadCount) {
  std::vector<std::string> csv;
  for (const char* limit : {"OMP_THREAD_LIMIT=1", "OMP_THREAD_LIMIT=2", "OMP_THREAD_LIMIT=4"}) {
    const ProcessResult r = runTool(
        TESSIK_BIND_EXE,
        {"box.obj", "--skeleton", "bones.json", "--voxelizer", "cpu", "--resolution", "48", "--csv", "w.csv"},
        dir_.string(), {}, {limit});
    ASSERT_EQ(r.status, 0) << r.err;
    std::ifstream in(dir_ / "w.csv");
    csv.emplace_back(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  }
  ASSERT_FALSE(csv[0].empty());
  EXPECT_EQ(csv[1], csv[0]);
  EXPECT_EQ(csv[2], csv[0]);
}

TEST_F(CliTest, InterruptStopsTheRunAndWritesNothing) {
  // A fine grid keeps the binding busy long enough for the signal to land inside it.
  const ProcessResult r = run({"--resolution", "256", "-o", "c.glb", "--preview", "c.png"}, " ...\n");
  EXPECT_EQ(r.status, 130) << r.err;
  EXPECT_NE(r.err.find("cancelled"), std::string::npos) << r.err;
  EXPECT_EQ(files(), (std::set<std::string>{"bones.json", "box.obj"}));
}

}  // namespace
}  // namespace tessik::test
