#include "linux/system/Directories.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <sys/stat.h>

#include "testing/TempTree.h"

namespace halyard::linux_ {
namespace {

using ::testing::HasSubstr;
using Variables = std::map<std::string, std::string, std::less<>>;

constexpr std::uint32_t kRoot = 0;
constexpr std::uint32_t kUser = 1000;

Result<Directories> resolve(const Variables& variables, std::uint32_t uid) {
    return resolveDirectories(
        [&](std::string_view name) -> std::optional<std::string> {
            const auto found = variables.find(name);
            return found == variables.end() ? std::nullopt : std::optional(found->second);
        },
        uid);
}

Directories resolved(const Variables& variables, std::uint32_t uid) {
    const auto result = resolve(variables, uid);
    if (!result.ok()) {
        ADD_FAILURE() << result.failure().message();
        return {};
    }
    return result.value();
}

std::string problem(const Variables& variables, std::uint32_t uid) {
    const auto result = resolve(variables, uid);
    return result.ok() ? "" : result.failure().message();
}

mode_t modeOf(const std::filesystem::path& path) {
    struct stat facts {};
    EXPECT_EQ(::stat(path.c_str(), &facts), 0) << path;
    return facts.st_mode & 07777;
}

TEST(DirectoriesTest, AServiceManagersDirectoriesComeFirst) {
    const Variables managed{{"CONFIGURATION_DIRECTORY", "/c"}, {"STATE_DIRECTORY", "/s"},
                            {"RUNTIME_DIRECTORY", "/r"},       {"LOGS_DIRECTORY", "/l"},
                            {"XDG_CONFIG_HOME", "/x"},         {"HOME", "/h"}};
    EXPECT_EQ(resolved(managed, kRoot), (Directories{"/c", "/s", "/r", "/l"}));
    EXPECT_EQ(resolved(managed, kUser), (Directories{"/c", "/s", "/r", "/l"}));
}

TEST(DirectoriesTest, OfSeveralManagedDirectoriesTheFirstCounts) {
    EXPECT_EQ(resolved({{"STATE_DIRECTORY", "/s/halyard:/s/other"}}, kRoot).state, "/s/halyard");
}

TEST(DirectoriesTest, RootHasTheSystemsDirectories) {
    const Directories system{"/etc/halyard", "/var/lib/halyard", "/run/halyard",
                             "/var/log/halyard"};
    EXPECT_EQ(resolved({}, kRoot), system);
    EXPECT_EQ(resolved({{"XDG_CONFIG_HOME", "/x"}, {"XDG_RUNTIME_DIR", "/x"}}, kRoot), system);
}

TEST(DirectoriesTest, AUserHasTheirBaseDirectories) {
    EXPECT_EQ(resolved({{"XDG_CONFIG_HOME", "/c"},
                        {"XDG_STATE_HOME", "/s"},
                        {"XDG_RUNTIME_DIR", "/r"},
                        {"HOME", "/h"}},
                       kUser),
              (Directories{"/c/halyard", "/s/halyard", "/r/halyard", "/s/halyard/log"}));
}

TEST(DirectoriesTest, BaseDirectoriesFallBackBelowHome) {
    const Directories home{"/h/.config/halyard", "/h/.local/state/halyard", "/r/halyard",
                           "/h/.local/state/halyard/log"};
    EXPECT_EQ(resolved({{"XDG_RUNTIME_DIR", "/r"}, {"HOME", "/h"}}, kUser), home);
    EXPECT_EQ(resolved({{"XDG_RUNTIME_DIR", "/r"},
                        {"HOME", "/h"},
                        {"XDG_CONFIG_HOME", ""},
                        {"XDG_STATE_HOME", "relative"}},
                       kUser),
              home);
}

TEST(DirectoriesTest, EachDirectoryIsResolvedByItself) {
    EXPECT_EQ(resolved({{"STATE_DIRECTORY", "/s"}}, kRoot),
              (Directories{"/etc/halyard", "/s", "/run/halyard", "/var/log/halyard"}));
}

TEST(DirectoriesTest, OneDirectoryNeedsNoneOfTheOthers) {
    const auto none = [](std::string_view name) -> std::optional<std::string> {
        return name == "XDG_STATE_HOME" ? std::optional<std::string>("/x") : std::nullopt;
    };
    const auto state = resolveDirectory(&Directories::state, none, kUser);
    ASSERT_TRUE(state.ok());
    EXPECT_EQ(state.value(), "/x/halyard");
    EXPECT_FALSE(resolveDirectory(&Directories::runtime, none, kUser).ok());
}

TEST(DirectoriesTest, AUserWithoutRuntimeDirectoryIsTold) {
    EXPECT_EQ(problem({{"HOME", "/h"}}, kUser),
              "no runtime directory: neither RUNTIME_DIRECTORY nor XDG_RUNTIME_DIR is set to an "
              "absolute path");
}

TEST(DirectoriesTest, AUserWithoutHomeIsTold) {
    EXPECT_EQ(problem({{"XDG_RUNTIME_DIR", "/r"}, {"XDG_CONFIG_HOME", "/c"}}, kUser),
              "none of STATE_DIRECTORY, XDG_STATE_HOME and HOME is set to an absolute path");
}

TEST(DirectoriesTest, AManagedDirectoryMustBeAbsolute) {
    EXPECT_EQ(problem({{"STATE_DIRECTORY", "here"}}, kRoot),
              "STATE_DIRECTORY is no absolute path: here");
}

TEST(MappedDirectoryTest, AudioLogsAreInTheLogsDirectory) {
    const Directories directories{"/c", "/s", "/r", "/l"};
    const std::string audio = "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio";

    EXPECT_EQ(directories.mapped(audio + "/Reporting"), "/l/Reporting");
    EXPECT_EQ(directories.mapped(audio + "/Traces"), "/l/Traces");
    EXPECT_EQ(directories.mapped(audio + "/Traces/tracing_results.pbj"),
              "/l/Traces/tracing_results.pbj");
    EXPECT_EQ(directories.mapped(audio), "/l");
}

TEST(MappedDirectoryTest, OtherPathsStayWhatTheyWere) {
    const Directories directories{"/c", "/s", "/r", "/l"};
    const std::string audio = "/private/var/mobile/Library/Logs/FaultDepot/DiagnosticLogs/Audio";

    for (const std::string& path : {std::string("/tmp/x"), audio + "Extra/x", audio + "/../x",
                                    std::string("/private/var"), std::string()}) {
        EXPECT_EQ(directories.mapped(path), path);
    }
}

TEST(CreateDirectoriesTest, MakesWhatIsMissingWithItsMode) {
    const testing::TempTree tree;
    const Directories directories{tree / "c", tree / "a/b/state", tree / "run", tree / "a/log"};
    const mode_t mask = ::umask(0077);
    const auto created = createDirectories(directories);
    ::umask(mask);

    EXPECT_TRUE(created.ok());
    EXPECT_EQ(modeOf(directories.state), 0750u);
    EXPECT_EQ(modeOf(directories.logs), 0750u);
    EXPECT_EQ(modeOf(directories.runtime), 0755u);
    EXPECT_FALSE(std::filesystem::exists(directories.configuration));
}

TEST(CreateDirectoriesTest, OfWhatIsThereOnlyTheRuntimeDirectoryIsOpened) {
    const testing::TempTree tree;
    const Directories directories{tree / "c", tree / "s", tree / "r", tree / "l"};
    for (const auto& path : {directories.state, directories.runtime, directories.logs}) {
        ASSERT_EQ(::mkdir(path.c_str(), 0700), 0);
    }

    EXPECT_TRUE(createDirectories(directories).ok());
    EXPECT_EQ(modeOf(directories.state), 0700u);
    EXPECT_EQ(modeOf(directories.logs), 0700u);
    EXPECT_EQ(modeOf(directories.runtime), 0755u);
}

TEST(CreateDirectoriesTest, ASharedRuntimeDirectoryStaysShared) {
    const testing::TempTree tree;
    const Directories directories{tree / "c", tree / "s", tree / "r", tree / "l"};
    ASSERT_EQ(::mkdir(directories.runtime.c_str(), 0700), 0);
    ASSERT_EQ(::chmod(directories.runtime.c_str(), 01777), 0);

    EXPECT_TRUE(createDirectories(directories).ok());
    EXPECT_EQ(modeOf(directories.runtime), 01777u);
}

TEST(CreateDirectoriesTest, TellsWhichDirectoryCannotBeMade) {
    const testing::TempTree tree;
    tree.write("file", "");

    EXPECT_THAT(createDirectories({tree / "c", tree / "file/s", tree / "r", tree / "l"})
                    .failure()
                    .message(),
                HasSubstr("cannot make directory " + (tree / "file").native()));
    EXPECT_THAT(
        createDirectories({tree / "c", tree / "s", tree / "file", tree / "l"}).failure().message(),
        HasSubstr("cannot make directory " + (tree / "file").native() + ": File exists"));
}

} // namespace
} // namespace halyard::linux_
