// Copies of the product executable: two steps that do nothing, and the search that would feed them.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "patchhome.h"

namespace {

using Names = std::vector<std::string>;

const std::string Entry = "PatchProcessor::findProductEXEFiles() entry";
const std::string Exit = "PatchProcessor::findProductEXEFiles() exit";

class ProductExeTest : public PatchHome {
public:
  Processor naming(const std::string &executable) {
    const std::string line = executable.empty() ? "" : "productEXE = " + executable + "\n";
    return loaded("kxe_lpp266_vema_fp0001.tar", patchIni("kxe", "06200001", line));
  }
  std::string agentDirectory() const { return home() + "vmaorv6"; }
  std::string checking(const std::string &executable) const {
    return "Checking for matching productEXE files in " + agentDirectory() + ", matching " + executable;
  }
  /// Names of the copies that are found, sorted.
  Names found(const std::string &executable) {
    std::vector<File *> files;
    EXPECT_TRUE(naming(executable)->findProductEXEFiles(files, nullptr));
    Names names;
    for (File *file : files) {
      const std::unique_ptr<File> owned(file);
      names.push_back(owned->getPath().substr(agentDirectory().size() + 1));
    }
    std::sort(names.begin(), names.end());
    return names;
  }
  void fill(const Names &files) const {
    for (const std::string &file : files)
      write("vmaorv6/" + file, "x");
  }
};

TEST_F(ProductExeTest, ExecutableItselfIsTheFileWhoseSmallLettersAreItsNameAsGiven) {
  fill({"AgentX.bin"});
  EXPECT_EQ(found("agentx.bin"), Names{});
  EXPECT_EQ(found("AgentX.bin"), Names{"AgentX.bin"});
}

TEST_F(ProductExeTest, UpdateOnlyTraces) {
  fill({"agent_copy.bin"});
  const Processor kxe = naming("agent.bin");
  PatchError err;
  EXPECT_TRUE(kxe->updateProductEXEFiles(&err));
  EXPECT_TRUE(kxe->updateProductEXEFiles(nullptr));
  EXPECT_EQ(recordOf(err), NoError);
  const LogLines once =
      pps({"PatchProcessor::updateProductEXEFiles() entry", "PatchProcessor::updateProductEXEFiles() = 1"});
  EXPECT_EQ(logLines(), joined({once, once}));
  EXPECT_EQ(read(home() + "vmaorv6/agent_copy.bin"), "x");
}

TEST_F(ProductExeTest, ListingOnlyTraces) {
  fill({"agent_copy.bin"});
  const Processor kxe = naming("agent.bin");
  PatchError err;
  const Printed printed = printedBy([&] { return kxe->listProductEXEFiles(&err); });
  EXPECT_TRUE(printed.result);
  EXPECT_EQ(printed.out, "");
  EXPECT_EQ(recordOf(err), NoError);
  EXPECT_EQ(logLines(), pps({"PatchProcessor::listProductEXEFiles() entry",
                             "PatchProcessor::listProductEXEFiles() = 1"}));
}

TEST_F(ProductExeTest, WithoutAnExecutableNothingIsSearched) {
  fill({"agent_copy.bin"});
  const Processor kxe = naming("");
  std::vector<File *> files;
  EXPECT_TRUE(kxe->findProductEXEFiles(files, nullptr));
  EXPECT_TRUE(files.empty());
  EXPECT_EQ(logLines(), pps({Entry, Exit}));
}

TEST_F(ProductExeTest, CopyIsTracedWithItsAbsolutePath) {
  fill({"AGENTX_copy.BIN", "agentx.bin", "other.bin"});
  const Processor kxe = naming("agentx.bin");
  std::vector<File *> files;
  EXPECT_TRUE(kxe->findProductEXEFiles(files, nullptr));
  ASSERT_EQ(files.size(), 1U);
  const std::unique_ptr<File> copy(files.front());
  EXPECT_EQ(copy->getPath(), agentDirectory() + "/AGENTX_copy.BIN");
  EXPECT_TRUE(copy->isFile());
  EXPECT_EQ(ownLines(),
            pps({Entry, "ProductEXE = agentx.bin", checking("agentx.bin"),
                 "Found pruductEXE file to update: " + agentDirectory() + "/AGENTX_copy.BIN", Exit}));
}

TEST_F(ProductExeTest, FoundFilesAreAppended) {
  fill({"agent_copy.bin"});
  const auto kept = std::make_unique<File>("kept");
  std::vector<File *> files = {kept.get()};
  EXPECT_TRUE(naming("agent.bin")->findProductEXEFiles(files, nullptr));
  ASSERT_EQ(files.size(), 2U);
  const std::unique_ptr<File> copy(files.back());
  EXPECT_EQ(files.front(), kept.get());
}

TEST_F(ProductExeTest, CopiesBeginWithTheBaseAndHaveTheExtensionInAnyCase) {
  fill({"agentx.bin", "AGENTX_copy.BIN", "agentx_copy.sh", "agentx_copy", "Agentx2.bin", "xagentx.bin",
        "agentx.bin.bin", "sub/agentx_copy.bin"});
  EXPECT_EQ(found("agentx.bin"), (Names{"AGENTX_copy.BIN", "Agentx2.bin"}));
}

TEST_F(ProductExeTest, ExtensionIsWhatFollowsTheFirstPoint) {
  fill({"agent_1.tar.gz", "agent_2.gz", "agent_3.tar", "agent_4.TAR.GZ"});
  EXPECT_EQ(found("agent.tar.gz"), (Names{"agent_1.tar.gz", "agent_4.TAR.GZ"}));
}

TEST_F(ProductExeTest, PointAtTheEndIsAnEmptyExtension) {
  fill({"agent_1", "agent_2.", "agent_3.bin"});
  EXPECT_EQ(found("agent."), (Names{"agent_1", "agent_2."}));
}

TEST_F(ProductExeTest, ExecutableWithoutAPointIsTakenAsItIsWritten) {
  fill({"agent_copy", "agent_copy.bin", "agent"});
  EXPECT_EQ(found("agent"), Names{"agent_copy"});
  EXPECT_EQ(found("Agent"), Names{}) << "no name in lower case begins with it";
}

TEST_F(ProductExeTest, ExecutableInCapitalsIsNotRecognisedAsItself) {
  fill({"agent.bin", "agent_copy.bin"});
  EXPECT_EQ(found("AGENT.BIN"), (Names{"agent.bin", "agent_copy.bin"}));
}

TEST_F(ProductExeTest, MissingDirectoryIsTraced) {
  const Processor kxe = naming("agent.bin");
  std::vector<File *> files;
  EXPECT_TRUE(kxe->findProductEXEFiles(files, nullptr));
  const LogLines lines = pps({Entry, "ProductEXE = agent.bin", checking("agent.bin"),
                              "Could not locate: " + agentDirectory(), Exit});
  EXPECT_EQ(ownLines(), lines);
  write("vmaorv6", "a file");
  EXPECT_TRUE(kxe->findProductEXEFiles(files, nullptr));
  EXPECT_EQ(ownLines(), lines);
  EXPECT_TRUE(files.empty());
}

TEST_F(ProductExeTest, DirectoryWithoutFilesIsTraced) {
  makeDirectory("vmaorv6/sub");
  const Processor kxe = naming("agent.bin");
  std::vector<File *> files;
  EXPECT_TRUE(kxe->findProductEXEFiles(files, nullptr));
  EXPECT_EQ(ownLines(), pps({Entry, "ProductEXE = agent.bin", checking("agent.bin"),
                             "No files located in: " + agentDirectory(), Exit}));
}

} // namespace
