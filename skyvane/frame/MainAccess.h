#pragma once
// The host-facing side of the module object: a hidden window with the
// operations behind the four exports, its copy of the host context and its
// log sink, and the hooks the log sink calls back.

#include "platform/collections.h"
#include "platform/window.h"

#include <memory>

class CConfigData;
class CLogRec;
class CLogSink;

class CMainAccess : public CWnd {
public:
    CMainAccess();
    // Deletes the context copy and the log sink if DllExit has not.
    ~CMainAccess() override;

    // Creates and starts the log sink (replacing one of an earlier Init),
    // then copies the context into the module's copy, created on the first
    // call. 1 on success; 0 when there is no context to copy.
    virtual int Init(CConfigData* context);
    // Copy the context into the module's copy: 0 before the first Init (or
    // without a context), else 1.
    virtual int Konfig(CConfigData* context);
    virtual int ExecAction(CConfigData* context);
    // Deletes the context copy and the log sink; 1.
    virtual int DllExit(int unused);

    // Hooks of the log sink; the base ones change nothing.
    virtual void OnFillLogFields(CLogRec* record);
    virtual void OnFillLogModules(CStringArray& names);
    // A name for the log sink; empty keeps the library's default.
    virtual CString GetLogSinkName();
    virtual bool OnLogLevels(const BYTE* levels, int count);

    // The module's copy of the host context; null before the first Init and after DllExit.
    CConfigData* GetConfigData() const { return m_pConfigData.get(); }
    CLogSink* GetLogSink() const { return m_pLogSink.get(); }

private:
    int CopyContext(CConfigData* context);

    std::unique_ptr<CConfigData> m_pConfigData;
    std::unique_ptr<CLogSink> m_pLogSink;  // the module's own sink, current while it exists
};
