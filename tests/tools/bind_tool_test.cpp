#include "bind_tool.h"

#include <algorithm>
#include <filesystem>
#include <set>
#include <sstream>

#include <stb_image.h>

#include "skinned_gltf_check.h"
#include "support/gl_context_fixture.h"

namespace tessik::bind {
namespace {

namespace fs = std::filesystem;
namespace gb = TessikSDK::GeomBind;

// Counts phases and cancels when told to, as a host's Cancel button would.
class HostProgress final : public gb::IProgress {
 public:
  explicit HostProgress(int cancelAtPhase = -1) : cancelAtPhase_(cancelAtPhase) {}
  void begin(const char*, int, int) override { ++phases; }
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override { return true; }
  bool isCanceled() override { return cancelAtPhase_ >= 0 && phases >= cancelAtPhase_; }
  int phases = 0;

 private:
  int cancelAtPhase_;
};

class BindToolTest : public test::GLContextTest {
 protected:
  void SetUp() override {
    GLContextTest::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    dir_ = fs::temp_directory_path() / ("tessik_bind_tool_" + std::to_string(::getpid()));
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }

  // The built-in character at a coarse resolution, which keeps each run to a few seconds.
  ToolOptions builtIn(const std::string& stem) const {
    ToolOptions o;
    o.outputPath = (dir_ / (stem + ".glb")).string();
    o.previewPath = (dir_ / (stem + ".png")).string();
    o.csvPath = (dir_ / (stem + ".csv")).string();
    o.previewSize = 200;
    o.settings.resolution = 32;
    return o;
  }

  int run(const ToolOptions& o, gb::IProgress& progress) {
    out_.str("");
    err_.str("");
    return runBindTool(o, progress, nullptr, out_, err_);
  }

  std::size_t filesInDir() const {
    return static_cast<std::size_t>(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()));
  }

  fs::path dir_;
  std::ostringstream out_, err_;
};

std::vector<unsigned char> loadPng(const std::string& path, int& w, int& h) {
  int channels = 0;
  unsigned char* data = stbi_load(path.c_str(), &w, &h, &channels, 3);
  if (data == nullptr) return {};
  std::vector<unsigned char> pixels(data, data + static_cast<std::size_t>(w) * h * 3);
  stbi_image_free(data);
  return pixels;
}

TEST_F(BindToolTest, BuiltInCharacterIsWrittenSkinnedAndDrawn) {
  HostProgress progress;
  ToolOptions posed = builtIn("posed");
  posed.pose = defaultCharacterPose();
  ASSERT_EQ(run(posed, progress), kExitOk) << err_.str();
  EXPECT_GT(progress.phases, 3);
  EXPECT_NE(out_.str().find("bones       30"), std::string::npos) << out_.str();

  const test::SkinnedGltf gltf = test::readSkinnedGltf(posed.outputPath);
  ASSERT_TRUE(gltf.error.empty()) << gltf.error;
  EXPECT_EQ(gltf.jointNames.size(), 30u);
  EXPECT_EQ(gltf.jointNames.front(), "pelvis");
  EXPECT_GT(gltf.vertices, 5000u);
  for (std::size_t v = 0; v < gltf.vertices; ++v) {
    float sum = 0.0f;
    for (const auto& [joint, weight] : gltf.influences[v]) {
      ASSERT_LT(joint, gltf.jointNames.size());
      sum += weight;
    }
    ASSERT_NEAR(sum, 1.0f, 1e-5f) << "vertex " << v;
  }
  // The left hand (toward +x, past the elbow) follows the left arm's bones, never the right's or the spine.
  std::size_t leftHand = 0;
  for (std::size_t v = 0; v < gltf.vertices; ++v) {
    if (gltf.positions[v][0] < 0.5f) continue;
    ++leftHand;
    const auto strongest = std::max_element(gltf.influences[v].begin(), gltf.influences[v].end(),
                                            [](const auto& a, const auto& b) { return a.second < b.second; });
    ASSERT_EQ(gltf.jointNames[strongest->first].rfind("l_", 0), 0u) << gltf.jointNames[strongest->first];
  }
  EXPECT_GT(leftHand, 100u);

  int w = 0, h = 0;
  const std::vector<unsigned char> posedPixels = loadPng(posed.previewPath, w, h);
  ASSERT_EQ(w, 200);
  ASSERT_EQ(h, 200);
  std::set<std::uint32_t> colours;
  for (std::size_t i = 0; i < posedPixels.size(); i += 3)
    colours.insert(posedPixels[i] << 16 | posedPixels[i + 1] << 8 | posedPixels[i + 2]);
  EXPECT_GT(colours.size(), 50u) << "the preview looks blank";

  // The same binding without the pose draws a different picture: the bent arm has moved.
  ToolOptions rest = builtIn("rest");
  rest.pose.clear();
  rest.pose.push_back({"l_elbow", 0.0, 0.0, 0.0});
  ASSERT_EQ(run(rest, progress), kExitOk) << err_.str();
  const std::vector<unsigned char> restPixels = loadPng(rest.previewPath, w, h);
  ASSERT_EQ(restPixels.size(), posedPixels.size());
  std::size_t changed = 0;
  for (std::size_t i = 0; i < restPixels.size(); i += 3) changed += restPixels[i] != posedPixels[i] ? 1 : 0;
  EXPECT_GT(changed, restPixels.size() / 3 / 100) << "bending the elbow hardly changed the picture";
}

TEST_F(BindToolTest, CancelledRunWritesNothing) {
  for (const BindMethod method : {BindMethod::geodesic, BindMethod::heatmap}) {
    SCOPED_TRACE(methodName(method));
    HostProgress progress(1);
    ToolOptions o = builtIn("cancelled");
    o.settings.method = method;
    EXPECT_EQ(run(o, progress), kExitCancelled);
    EXPECT_NE(err_.str().find("cancelled"), std::string::npos) << err_.str();
    EXPECT_EQ(filesInDir(), 0u);
  }
}

}  // namespace
}  // namespace tessik::bind
