#include "output_files.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "terminal_progress.h"

namespace tessik::bind {
namespace {

namespace fs = std::filesystem;

class OutputFilesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("tessik_outputs_" + std::to_string(::getpid()));
    fs::create_directories(dir_);
    std::ofstream(dir_ / "old.glb") << "old";
  }
  void TearDown() override { fs::remove_all(dir_); }

  std::string read(const std::string& name) const {
    std::ifstream in(dir_ / name);
    return {std::istreambuf_iterator<char>(in), {}};
  }
  std::size_t count() const {
    return static_cast<std::size_t>(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()));
  }

  fs::path dir_;
};

TEST_F(OutputFilesTest, StagedFilesReplaceTheirDestinationsOnlyOnCommit) {
  {
    PendingOutputs files;
    const std::string temporary = files.stage((dir_ / "old.glb").string());
    EXPECT_EQ(fs::path(temporary).extension(), ".glb");  // writers choose their format by it
    EXPECT_EQ(fs::path(temporary).parent_path(), dir_);  // a rename never crosses file systems
    std::ofstream(temporary) << "half";
    EXPECT_EQ(count(), 2u);
  }  // dropped without commit, as a failed run does
  EXPECT_EQ(read("old.glb"), "old");
  EXPECT_EQ(count(), 1u);

  PendingOutputs files;
  std::ofstream(files.stage((dir_ / "old.glb").string())) << "new";
  std::ofstream(files.stage((dir_ / "w.csv").string())) << "rows";
  files.commit();
  EXPECT_EQ(read("old.glb"), "new");
  EXPECT_EQ(read("w.csv"), "rows");
  EXPECT_EQ(count(), 2u);
  // Readable by others as any new file would be under the usual umask, not private like a temporary.
  struct stat st {};
  ASSERT_EQ(::stat((dir_ / "w.csv").c_str(), &st), 0);
  EXPECT_NE(st.st_mode & S_IRGRP, 0u);
}

TEST_F(OutputFilesTest, UnwritablePlacesFailAtOnceWithTheirName) {
  PendingOutputs files;
  for (const fs::path& p : {dir_ / "missing" / "x.glb", dir_}) {
    try {
      files.stage(p.string());
      ADD_FAILURE() << "staged " << p;
    } catch (const std::runtime_error& e) {
      EXPECT_NE(std::string(e.what()).find(p.string()), std::string::npos) << e.what();
    }
  }
}

TEST(TerminalProgressTest, DrawsABarOnATerminalAndLinesElsewhere) {
  for (const bool interactive : {true, false}) {
    std::FILE* f = std::tmpfile();
    ASSERT_NE(f, nullptr);
    std::atomic<bool> cancel{false};
    TerminalProgress progress(f, &cancel, interactive);
    progress.begin("Smoothing", 200, 100);
    progress.update(150);
    progress.end();
    EXPECT_FALSE(progress.isCanceled());
    cancel = true;
    EXPECT_TRUE(progress.isCanceled());
    std::rewind(f);
    std::string text(4096, '\0');
    text.resize(std::fread(text.data(), 1, text.size(), f));
    std::fclose(f);
    EXPECT_EQ(text.find(" 50%") != std::string::npos, interactive) << text;
    EXPECT_EQ(text.find("Smoothing ...\n") != std::string::npos, !interactive) << text;
    EXPECT_NE(text.find(" s\n"), std::string::npos) << text;  // each phase ends with its time
  }
}

}  // namespace
}  // namespace tessik::bind
