#pragma once
// libSkyvane.so loaded at run time, as a host loads a protocol module: by
// path, its four exports looked up by name.

#include "platform/library.h"
#include "platform/text.h"

class CConfigData;

class CSkyvaneModule {
public:
    CSkyvaneModule() = default;
    ~CSkyvaneModule() { Unload(); }
    CSkyvaneModule(const CSkyvaneModule&) = delete;
    CSkyvaneModule& operator=(const CSkyvaneModule&) = delete;

    // Loads the library and finds init, konfig, exec_action and dll_exit.
    // False with one line naming the file and the cause.
    bool Load(const CString& path, CString& error);
    void Unload();
    bool IsLoaded() const { return m_hModule != nullptr; }

    int Init(CConfigData* context) const { return m_pfnInit(context); }
    int Konfig(CConfigData* context) const { return m_pfnKonfig(context); }
    int ExecAction(CConfigData* context) const { return m_pfnExecAction(context); }
    int DllExit(int unused) const { return m_pfnDllExit(unused); }

private:
    using ContextFn = int (*)(CConfigData*);
    using ExitFn = int (*)(int);

    HMODULE m_hModule = nullptr;
    ContextFn m_pfnInit = nullptr;
    ContextFn m_pfnKonfig = nullptr;
    ContextFn m_pfnExecAction = nullptr;
    ExitFn m_pfnDllExit = nullptr;
};
