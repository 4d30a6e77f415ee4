#pragma once
// The subscription of one project's variables in an online variable container.

#include "runtime/EventSink.h"
#include "runtime/RefCounting.h"
#include "runtime/RuntimeNotifications.h"

#include "platform/collections.h"
#include "platform/sync.h"

class COnlVariables : public CCmdTarget {
public:
    explicit COnlVariables(IOnlVariablesNtf* pNotify) : m_xOnlVariableEv(this), m_pNotify(pNotify) {}
    ~COnlVariables() override;

    // Looks the variable up in the project and notes its name and id. On true
    // the holder cell belongs to this object; on false it stays the caller's.
    bool AddVariable(IDispatch* pProject, const CString& strVariable, CVarItem** ppHolder);
    // Takes a container: adds every noted name, advises and starts it.
    bool Attach(IDispatch* pContainer);
    // Stops the container, takes the names out and lets it go. Names and ids stay.
    void Detach();

    const CStringList& Names() const { return m_lstNames; }

    class XOnlVariableEv final : public XEvents {
    public:
        explicit XOnlVariableEv(COnlVariables* owner) : m_pOwner(owner) {}
        ~XOnlVariableEv() override { Unadvise(); }
        IID GetEventIID() const override;

    protected:
        void OnEvent(DISPID member, const DispatchArgs& args) override;

    private:
        COnlVariables* m_pOwner;
    };

private:
    void OnVariableBulkChange(const DispatchArgs& args);
    CVarItem** FindCell(DWORD id);

    XOnlVariableEv m_xOnlVariableEv;
    CComPtr<IDispatch> m_pContainer;              // the runtime's container, null while detached
    CStringList m_lstNames;                       // names added, in order
    CCriticalSection m_csIds;                     // guards m_mapIds: read on the runtime's event thread
    CMapOwner<DWORD, DWORD, CVarItem*> m_mapIds;  // runtime id -> holder cell (owns the cells only)
    IOnlVariablesNtf* m_pNotify;
};
