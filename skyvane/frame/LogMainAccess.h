#pragma once
// The module's log sink: the library's sink with the module's client names
// and with the module object's hooks called where the sink reads its
// configuration, fills its records and takes new parameters.

#include "brennic/logsink.h"

class CMainAccess;

class CLogMainAccess : public CLogSink {
public:
    explicit CLogMainAccess(CMainAccess* owner);
    ~CLogMainAccess() override;

    // The base's; when it succeeds the owner learns the level table.
    bool ReadCfg() override;
    // The library's names, padded to 16, then the module's: "Pelgrad" (16),
    // "KAP" (17), an empty name (18) and "PelgradDll" (19), the index of
    // every record of this module.
    void FillClientModules(CStringArray& names) override;
    void FillClientFields(CLogRec* record) override;
    // The owner learns the new level table before the sink applies it.
    void CmdSetParameter(const CCliParam& param) override;

private:
    CMainAccess* m_pMainAccess;  // the module object that created this sink; not owned
};
