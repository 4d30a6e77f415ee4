#include "runtime/MultipleOnlVarsPerPrj.h"

#include "cloud/VarItem.h"

void SplitVariableKey(const CString& key, const CString& defaultProject, CString& project, CString& variable) {
    CVarItem::SplitKey(key, project, variable);
    if (project.IsEmpty()) project = defaultProject;
}

bool CMultipleOnlVarsPerPrj::AddVariable(const CString& strKey, CVarItem** ppHolder) {
    CString project, variable;
    SplitVariableKey(strKey, m_strDefaultProject, project, variable);
    auto it = m_mapProjects.find(project);
    if (it == m_mapProjects.end()) {
        auto perProject = VX_CreateCounted<CXOnlVarsPerProject>(m_pNotify, m_dwTimeout, 0);
        if (!perProject->Attach(project)) return false;
        it = m_mapProjects.emplace(project, perProject).first;
    }
    return it->second->AddVariable(variable, ppHolder);
}

bool CMultipleOnlVarsPerPrj::Start() {
    for (auto& [name, perProject] : m_mapProjects) {
        if (!perProject->Start()) {
            m_mapProjects.clear();
            return false;
        }
    }
    return true;
}

void CMultipleOnlVarsPerPrj::ProcessPending() {
    for (auto& [name, perProject] : m_mapProjects) perProject->ProcessPending();
}

void CMultipleOnlVarsPerPrj::ReleaseVariables() {
    for (auto& [name, perProject] : m_mapProjects) perProject->ReleaseVariables();
}
