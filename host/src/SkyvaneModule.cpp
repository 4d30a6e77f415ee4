#include "SkyvaneModule.h"

bool CSkyvaneModule::Load(const CString& path, CString& error) {
    Unload();
    // A name without a slash would make the loader search the library path.
    const CString file = path.Find(u'/') < 0 ? u"./" + path : path;
    m_hModule = LoadLibrary(file);
    if (!m_hModule) {
        error = u"cannot load the module '" + path + u"': " + GetLoaderError();
        return false;
    }
    struct Export {
        const char* name;
        void** slot;
    };
    const Export exports[] = {{"init", reinterpret_cast<void**>(&m_pfnInit)},
                              {"konfig", reinterpret_cast<void**>(&m_pfnKonfig)},
                              {"exec_action", reinterpret_cast<void**>(&m_pfnExecAction)},
                              {"dll_exit", reinterpret_cast<void**>(&m_pfnDllExit)}};
    for (const Export& entry : exports) {
        *entry.slot = GetProcAddress(m_hModule, entry.name);
        if (!*entry.slot) {
            error = u"the module '" + path + u"' lacks the export '" + CString::FromUtf8(entry.name) + u"'";
            Unload();
            return false;
        }
    }
    return true;
}

void CSkyvaneModule::Unload() {
    if (m_hModule) FreeLibrary(m_hModule);
    m_hModule = nullptr;
    m_pfnInit = m_pfnKonfig = m_pfnExecAction = nullptr;
    m_pfnDllExit = nullptr;
}
