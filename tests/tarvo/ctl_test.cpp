// tarvo-runtime and tarvo-ctl as programs: a runtime process on a private
// socket folder, driven and read by the command-line client.
#include "runtime_process.h"
#include "temp_folder.h"

#include <gtest/gtest.h>

namespace {

constexpr const char* kProject = R"({"projects": [
  {"name": "Plant", "variables": [{"name": "Level", "value": 1}, {"name": "Mode", "type": "text", "value": "auto"}]},
  {"name": "Line2", "variables": [{"name": "Speed", "id": 7}]}]})";

// Runs tarvo-ctl with these arguments on the folder; its exit code and standard output.
ChildResult Ctl(const std::string& folder, const std::vector<std::string>& args) {
    std::vector<std::string> argv{
        (std::filesystem::read_symlink("/proc/self/exe").parent_path() / "tarvo-ctl").string(), "--socket-dir", folder};
    argv.insert(argv.end(), args.begin(), args.end());
    return RunChild(argv, /*withErrors=*/false);
}

}  // namespace

TEST(TarvoPrograms, CtlDrivesARuntimeProcess) {
    TempFolder folder;
    const std::string project = folder.Write("plant.json", kProject);
    const std::string sockets = folder.Path("sockets");
    EXPECT_EQ(Ctl(sockets, {"projects"}).exitCode, 1) << "no runtime yet";

    RuntimeProcess runtime;
    ASSERT_TRUE(runtime.Start(project, sockets, {"--paused"})) << runtime.Output();
    EXPECT_EQ(Ctl(sockets, {"projects"}).output, "Plant\nLine2\n");
    EXPECT_EQ(Ctl(sockets, {"variables", "Line2"}).output, "7 Speed\n");
    EXPECT_EQ(Ctl(sockets, {"set", "Plant", "Level", "42.5"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"set-text", "Plant", "Mode", "manual"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"status", "Plant", "Level", "0x100000002"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"set", "Plant", "NoSuchVariable", "1"}).exitCode, 1);
    EXPECT_EQ(Ctl(sockets, {"deactivate", "Plant"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"fault", "start", "on"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"fault", "clear"}).exitCode, 0);
    EXPECT_EQ(Ctl(sockets, {"containers", "Plant"}).output, "");
    EXPECT_EQ(Ctl(sockets, {"bulk", "Plant", "", "1=2"}).exitCode, 1) << "no container to fire at";
    EXPECT_EQ(Ctl(sockets, {"status", "Plant", "Level", "-1"}).exitCode, 2);
    EXPECT_EQ(Ctl(sockets, {"fault", "raise", "nothing", "3", "on"}).exitCode, 2);
    EXPECT_EQ(Ctl(sockets, {"frobnicate"}).exitCode, 2);

    // A second runtime on the same folder is refused while the first runs.
    RuntimeProcess second;
    EXPECT_FALSE(second.Start(project, sockets));
    EXPECT_NE(second.Output().find("running already"), std::string::npos) << second.Output();

    EXPECT_TRUE(runtime.Stop()) << runtime.Output();
    EXPECT_NE(runtime.Output().find("stopped (SIGTERM)"), std::string::npos);
    EXPECT_EQ(Ctl(sockets, {"projects"}).exitCode, 1);
}
