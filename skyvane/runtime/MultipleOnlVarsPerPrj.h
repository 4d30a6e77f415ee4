#pragma once
// The runtime link's project manager: one per-project subscription for every
// project that has exported variables.

#include "runtime/XOnlVarsPerProject.h"

#include <map>

// Splits a variable key "Project#Variable" at the first "#". A key without
// "#" names a variable of the default project.
void SplitVariableKey(const CString& key, const CString& defaultProject, CString& project, CString& variable);

class CMultipleOnlVarsPerPrj : public CCmdTarget {
public:
    CMultipleOnlVarsPerPrj(IOnlVariablesPerProjectNotification* pNotify, const CString& strDefaultProject,
                           DWORD dwTimeout)
        : m_pNotify(pNotify), m_strDefaultProject(strDefaultProject), m_dwTimeout(dwTimeout) {}

    // Subscribes the variable in its project. On true the holder cell belongs
    // to the runtime link; on false the caller deletes it.
    bool AddVariable(const CString& strKey, CVarItem** ppHolder);
    // Starts every project in map order; the first failure drops all projects.
    bool Start();
    void ProcessPending();
    void ReleaseVariables();

    using ProjectMap = std::map<CString, VX_KeepRefCmdPtr<CXOnlVarsPerProject>>;
    const ProjectMap& Projects() const { return m_mapProjects; }

private:
    IOnlVariablesPerProjectNotification* m_pNotify;
    CString m_strDefaultProject;
    DWORD m_dwTimeout;
    ProjectMap m_mapProjects;  // project name (case counts) -> its subscription; window thread only
};
