#include "bind_tool.h"

#include <algorithm>
#include <filesystem>
#include <sstream>

#include "support/gl_context_fixture.h"
#include "tool_outputs.h"

namespace tessik::bind {
namespace {

namespace fs = std::filesystem;
namespace gb = TessikSDK::GeomBind;

// Counts phases and cancels once a given one has begun, as a host's Cancel button would.
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
    o.previewSize = 200;
    o.settings.resolution = 32;
    return o;
  }

  int run(const ToolOptions& o, gb::IProgress& progress) {
    err_.str("");
    return runBindTool(o, progress, nullptr, out_, err_);
  }

  fs::path dir_;
  std::ostringstream out_, err_;
};

TEST_F(BindToolTest, BuiltInCharacterIsSkinnedByItsOwnBonesAndItsPoseShows) {
  HostProgress progress;
  ToolOptions posed = builtIn("posed");
  posed.pose = defaultCharacterPose();
  ASSERT_EQ(run(posed, progress), kExitOk) << err_.str();
  EXPECT_GT(progress.phases, 3);
  test::expectConsistentSkin(posed.outputPath, 30);

  // The left hand (toward +x, past the elbow) follows the left arm's bones, never the right's or the spine.
  const test::SkinnedGltf gltf = test::readSkinnedGltf(posed.outputPath);
  std::size_t leftHand = 0;
  for (std::size_t v = 0; v < gltf.vertices; ++v) {
    if (gltf.positions[v][0] < 0.5f) continue;
    ++leftHand;
    const auto strongest = std::max_element(gltf.influences[v].begin(), gltf.influences[v].end(),
                                            [](const auto& a, const auto& b) { return a.second < b.second; });
    ASSERT_EQ(gltf.jointNames[strongest->first].rfind("l_", 0), 0u) << gltf.jointNames[strongest->first];
  }
  EXPECT_GT(leftHand, 100u);

  // The same binding with the elbow straight draws a different picture.
  ToolOptions rest = builtIn("rest");
  rest.pose = {{"l_elbow", 0.0, 0.0, 0.0}};
  ASSERT_EQ(run(rest, progress), kExitOk) << err_.str();
  const test::Picture bent = test::loadPng(posed.previewPath), straight = test::loadPng(rest.previewPath);
  ASSERT_EQ(bent.width, 200);
  ASSERT_EQ(bent.rgb.size(), straight.rgb.size());
  EXPECT_GT(bent.distinctColours(), 50u) << "the preview looks blank";
  std::size_t changed = 0;
  for (std::size_t i = 0; i < bent.rgb.size(); i += 3) changed += bent.rgb[i] != straight.rgb[i] ? 1 : 0;
  EXPECT_GT(changed, bent.rgb.size() / 3 / 100) << "bending the elbow hardly changed the picture";
}

TEST_F(BindToolTest, CancelledRunWritesNothing) {
  for (const BindMethod method : {BindMethod::geodesic, BindMethod::heatmap}) {
    SCOPED_TRACE(methodName(method));
    HostProgress progress(1);
    ToolOptions o = builtIn("cancelled");
    o.settings.method = method;
    EXPECT_EQ(run(o, progress), kExitCancelled);
    EXPECT_NE(err_.str().find("cancelled"), std::string::npos) << err_.str();
    EXPECT_TRUE(fs::is_empty(dir_));
  }
}

}  // namespace
}  // namespace tessik::bind
