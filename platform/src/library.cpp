#include "platform/library.h"

#include <dlfcn.h>

namespace {
thread_local std::string t_lastError;

void NoteError() {
    const char* text = dlerror();
    t_lastError = text ? text : "unknown loader error";
}
}  // namespace

HMODULE LoadLibrary(const CString& path) {
    void* handle = dlopen(path.ToUtf8().c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) NoteError();
    else t_lastError.clear();
    return static_cast<HMODULE>(handle);
}

bool FreeLibrary(HMODULE module) {
    if (!module) return false;
    if (dlclose(module) != 0) {
        NoteError();
        return false;
    }
    return true;
}

void* GetProcAddress(HMODULE module, const char* name) {
    if (!module || !name) return nullptr;
    dlerror();
    void* symbol = dlsym(module, name);
    if (!symbol) NoteError();
    return symbol;
}

CString GetLoaderError() { return CString::FromUtf8(t_lastError); }
