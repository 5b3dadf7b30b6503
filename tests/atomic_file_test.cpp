// korvsnmp-stat --output: the file is replaced whole, never written in place.
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include <gtest/gtest.h>

#include "atomic_file.h"

namespace {

std::string Read(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

class AtomicFile : public ::testing::Test {
protected:
    void SetUp() override { std::filesystem::create_directory(directory_); }
    void TearDown() override { std::filesystem::remove_all(directory_); }

    size_t Entries() const
    {
        return static_cast<size_t>(std::distance(std::filesystem::directory_iterator(directory_),
                                                 std::filesystem::directory_iterator()));
    }

    const std::string directory_ = "/tmp/korvsnmp-output-" + std::to_string(getpid());
    const std::string path_ = directory_ + "/korvsnmp.prom";
};

TEST_F(AtomicFile, ReplacesTheFileInOneStepWhileAReaderKeepsTheOldOne)
{
    std::string error;
    ASSERT_TRUE(korvstat::ReplaceFile(path_, "old\n", error)) << error;
    std::ifstream reader(path_, std::ios::binary);  // node_exporter, mid-read
    ASSERT_TRUE(korvstat::ReplaceFile(path_, "# EOF\n", error)) << error;
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(reader), {}), "old\n");
    EXPECT_EQ(Read(path_), "# EOF\n");
    struct stat status {};
    ASSERT_EQ(stat(path_.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0644u);
    EXPECT_EQ(Entries(), 1u);  // no temporary file left beside it
}

TEST_F(AtomicFile, FailureSaysWhatAndLeavesNothing)
{
    std::string error;
    EXPECT_FALSE(korvstat::ReplaceFile(directory_ + "/missing/korvsnmp.prom", "x", error));
    EXPECT_EQ(error, "cannot create a file beside " + directory_ + "/missing/korvsnmp.prom: No such file or directory");
    std::filesystem::create_directory(path_);  // a directory cannot be replaced by a file
    EXPECT_FALSE(korvstat::ReplaceFile(path_, "x", error));
    EXPECT_EQ(error.rfind("cannot rename " + directory_ + "/.korvsnmp.prom.", 0), 0u) << error;
    EXPECT_NE(error.find(" to " + path_ + ": Is a directory"), std::string::npos) << error;
    EXPECT_EQ(Entries(), 1u);
}

}  // namespace
