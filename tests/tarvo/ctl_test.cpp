// tarvo-runtime and tarvo-ctl as programs: a runtime process on a private
// socket folder, driven and read by the command-line client; and the children
// of a test, which end with it.
#include "runtime_process.h"
#include "temp_folder.h"

#include <gtest/gtest.h>

#include <sys/syscall.h>

#include <cerrno>

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

// A child a test started ends when the test's process dies without cleaning up.
TEST(TestChildren, EndWhenTheirTestDies) {
    int report[2];
    ASSERT_EQ(::pipe2(report, O_CLOEXEC), 0);
    const pid_t test = ::fork();
    if (test == 0) {  // the test: starts a child, says which, and dies at once
        const pid_t child = StartChild({"/bin/sleep", "60"});
        if (::write(report[1], &child, sizeof child) != static_cast<ssize_t>(sizeof child)) ::_exit(1);
        ::raise(SIGKILL);
    }
    ASSERT_GT(test, 0);
    ::close(report[1]);
    pid_t child = -1;
    const ssize_t n = ::read(report[0], &child, sizeof child);
    ::close(report[0]);
    ::waitpid(test, nullptr, 0);
    ASSERT_EQ(n, static_cast<ssize_t>(sizeof child));
    ASSERT_GT(child, 0);
    // The orphan belongs to another parent now; its pid descriptor reports its end.
    const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, child, 0));
    if (pidfd < 0) {
        EXPECT_EQ(errno, ESRCH) << "neither gone nor observable";
        return;
    }
    pollfd ended{pidfd, POLLIN, 0};
    const int ready = ::poll(&ended, 1, 10000);
    ::close(pidfd);
    EXPECT_EQ(ready, 1) << "the child outlived its test by 10 s";
    if (ready != 1) ::kill(child, SIGKILL);
}
