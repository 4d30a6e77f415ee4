#pragma once
// The host context record: what the gateway host hands to init, konfig and
// exec_action. The module reads the host window and the settings file path;
// everything else it carries along for the host, copied by the host's rules.

#include "automation/unknown.h"
#include "platform/collections.h"
#include "platform/object.h"
#include "platform/text.h"
#include "platform/window.h"

// The host's progress state; carried along, never read by the module.
class CProgressBar {
public:
    virtual ~CProgressBar() = default;

    DWORD m_adwState[9] = {};
};

class CConfigData : public CObject {
public:
    CConfigData() = default;
    // Releases both interfaces.
    ~CConfigData() override;
    CConfigData(const CConfigData&) = delete;
    CConfigData& operator=(const CConfigData&) = delete;

    // Takes over what the module carries from another record: host window,
    // settings path, text, flag, both lists and both maps (replacing the
    // current entries), the six words, and both interfaces (a reference on
    // the new one, the old one released). The progress bar stays.
    void CopyFrom(const CConfigData& source);

    // Points an interface slot of a record at value: AddRef of the new one,
    // Release of the old one, nothing when they are the same.
    static void AssignInterface(IUnknown*& slot, IUnknown* value);

    CProgressBar m_ProgressBar;
    CWnd* m_pWnd = nullptr;  // host window: receives the status messages, parents dialogs; may be null
    CString m_strIniFile;    // full path of the module's settings file
    CString m_strText;
    CStringList m_lstFirst;
    CStringList m_lstSecond;
    IUnknown* m_pFirstInterface = nullptr;  // the record holds one reference on each interface
    DWORD m_adwWords[6] = {};
    CMapStringToPtr m_mapPointers;
    CMapStringToString m_mapTexts;
    IUnknown* m_pSecondInterface = nullptr;
    BYTE m_bFlag = 0;
};
