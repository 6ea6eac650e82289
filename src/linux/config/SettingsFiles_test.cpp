#include "linux/config/SettingsFiles.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

namespace fs = std::filesystem;

class SettingsFilesTest : public ::testing::Test {
protected:
    LoadedSettings loaded() const {
        auto result = loadSettings(tree_.path());
        EXPECT_TRUE(result.ok()) << (result.ok() ? "" : result.failure().message());
        return result.ok() ? std::move(result).value() : LoadedSettings();
    }
    // "PATH: MESSAGE", the path from the directory on; empty when all files are taken.
    std::string mistake() const {
        const auto result = loadSettings(tree_.path());
        return result.ok()
                   ? ""
                   : fs::path(result.failure().file).lexically_relative(tree_.path()).native() +
                         ": " + result.failure().message();
    }
    // The file that settles the consent, from the directory on; empty when none does.
    std::string deciding() const {
        const LoadedSettings all = loaded();
        const LoadedSettings::File* const file = all.decidingFile("export.consent");
        return file == nullptr ? "" : file->path.lexically_relative(tree_.path()).native();
    }

    testing::TempTree tree_;
};

TEST_F(SettingsFilesTest, WithoutFilesTheDefaultsHold) {
    EXPECT_EQ(loaded().settings, Settings());
    EXPECT_TRUE(loaded().files.empty());
    EXPECT_EQ(deciding(), "");
}

TEST_F(SettingsFilesTest, TheLastFileThatHasAKeyDecides) {
    tree_.write("halyard.toml", "[export]\nconsent = true\n");
    EXPECT_EQ(deciding(), "halyard.toml");
    tree_.write("halyard.d/b.toml", "export.consent = true\n");
    tree_.write("halyard.d/a.toml", "export.consent = false\n");
    tree_.write("halyard.d/c.toml", "export.signals = []\n");

    EXPECT_EQ(deciding(), "halyard.d/b.toml");
    EXPECT_TRUE(loaded().settings.exporting.consent);
}

TEST_F(SettingsFilesTest, OnlyNamesOfDropInsCount) {
    tree_.write("halyard.d/.hidden.toml", "broken");
    tree_.write("halyard.d/old.toml~", "broken");
    tree_.write("halyard.d/toml", "broken");

    EXPECT_EQ(loaded().settings, Settings());
}

TEST_F(SettingsFilesTest, WarningsBelongToTheirFile) {
    tree_.write("halyard.toml", "a = 1\n");
    tree_.write("halyard.d/x.toml", "\nb = 1\n");
    const LoadedSettings all = loaded();

    ASSERT_EQ(all.files.size(), 2u);
    EXPECT_FALSE(all.files[0].isDropIn);
    EXPECT_EQ(all.files[0].warnings.at(0).message, "unknown key a has no effect");
    EXPECT_TRUE(all.files[1].isDropIn);
    EXPECT_EQ(all.files[1].warnings.at(0).line, 2u);
}

TEST_F(SettingsFilesTest, TheNumberOfDropInsIsBounded) {
    for (std::size_t i = 0; i < kMaxDropIns; ++i) {
        tree_.write("halyard.d/" + std::to_string(i) + ".toml", "");
    }
    EXPECT_EQ(mistake(), "");
    tree_.write("halyard.d/one-more.toml", "");
    EXPECT_EQ(mistake(), "halyard.d: more than 64 files");
}

TEST_F(SettingsFilesTest, TheSizeOfEachIsBounded) {
    tree_.write("halyard.d/x.toml", std::string(kMaxSettingsBytes, '\n'));
    EXPECT_EQ(mistake(), "");
    tree_.write("halyard.d/x.toml", std::string(kMaxSettingsBytes + 1, '\n'));
    EXPECT_EQ(mistake(), "halyard.d/x.toml: File too large");
}

TEST_F(SettingsFilesTest, AFolderOfDropInsThatIsNoneIsAMistake) {
    tree_.write("halyard.d", "");

    EXPECT_EQ(mistake(), "halyard.d: Not a directory");
}

TEST_F(SettingsFilesTest, AMistakeInTheFirstFileIsToldBeforeThoseOfDropIns) {
    tree_.write("halyard.toml", "broken");
    tree_.write("halyard.d/x.toml", "broken");

    EXPECT_THAT(mistake(), ::testing::StartsWith("halyard.toml: "));
}

TEST_F(SettingsFilesTest, ALinkThatLeadsNowhereIsAFileThatIsGone) {
    fs::create_directory(tree_ / "halyard.d");
    fs::create_symlink("nowhere", tree_ / "halyard.d/x.toml");

    EXPECT_EQ(loaded().settings, Settings());
}

} // namespace
} // namespace halyard::linux_
