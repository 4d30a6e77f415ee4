#include "vxhelper/dirmanager.h"

#include <climits>
#include <cstdlib>
#include <string>

#include <dlfcn.h>
#include <unistd.h>

CString VX_DirManager::GetModuleDir(const void* addressInModule) {
    Dl_info info{};
    if (!addressInModule || dladdr(addressInModule, &info) == 0) return CString();
    std::string file = info.dli_fname ? info.dli_fname : "";
    if (file.find('/') == std::string::npos) {
        // The main program is reported by name only; ask the kernel where it is.
        char exe[PATH_MAX];
        const ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
        if (n <= 0) return CString();
        file.assign(exe, static_cast<size_t>(n));
    }
    char* resolved = realpath(file.c_str(), nullptr);
    if (!resolved) return CString();
    std::string path = resolved;
    std::free(resolved);
    return CString::FromUtf8(path.substr(0, path.rfind('/') + 1));
}
