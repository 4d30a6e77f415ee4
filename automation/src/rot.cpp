#include "automation/rot.h"

#include "automation/comptr.h"

#include <mutex>
#include <utility>
#include <vector>

namespace {

struct Registration {
    DWORD number;
    CLSID clsid;
    CComPtr<IUnknown> object;
};

struct SourceEntry {
    DWORD number;
    std::shared_ptr<IRunningObjectSource> source;
};

class RunningObjectTable {
public:
    static RunningObjectTable& Instance() {
        // Never destroyed: objects still registered at exit must not be
        // released while other static objects are already gone.
        static auto* table = new RunningObjectTable;
        return *table;
    }

    HRESULT Register(IUnknown* object, REFCLSID clsid, DWORD* registration) {
        if (!registration) return E_POINTER;
        *registration = 0;
        if (!object) return E_INVALIDARG;
        std::lock_guard lock(m_lock);
        *registration = NextNumber();
        m_registrations.push_back({*registration, clsid, CComPtr<IUnknown>(object)});
        return S_OK;
    }

    HRESULT Revoke(DWORD registration) {
        CComPtr<IUnknown> released;  // released after the lock: it may run the object's destructor
        std::lock_guard lock(m_lock);
        for (auto it = m_registrations.begin(); it != m_registrations.end(); ++it) {
            if (it->number == registration) {
                released = std::move(it->object);
                m_registrations.erase(it);
                return S_OK;
            }
        }
        return E_INVALIDARG;
    }

    HRESULT Get(REFCLSID clsid, IUnknown** object) {
        if (!object) return E_POINTER;
        *object = nullptr;
        std::vector<std::shared_ptr<IRunningObjectSource>> sources;
        {
            std::lock_guard lock(m_lock);
            for (const auto& r : m_registrations) {
                if (r.clsid == clsid) {
                    *object = CComPtr<IUnknown>(r.object).Detach();
                    return S_OK;
                }
            }
            for (const auto& s : m_sources) sources.push_back(s.source);
        }
        // Other sources may be slow (another process): ask them without the lock.
        for (const auto& source : sources) {
            IUnknown* found = nullptr;
            if (SUCCEEDED(source->GetObject(clsid, &found)) && found) {
                *object = found;
                return S_OK;
            }
        }
        return MK_E_UNAVAILABLE;
    }

    DWORD AddSource(std::shared_ptr<IRunningObjectSource> source) {
        if (!source) return 0;
        std::lock_guard lock(m_lock);
        const DWORD number = NextNumber();
        m_sources.push_back({number, std::move(source)});
        return number;
    }

    void RemoveSource(DWORD number) {
        std::shared_ptr<IRunningObjectSource> released;  // destroyed after the lock
        std::lock_guard lock(m_lock);
        for (auto it = m_sources.begin(); it != m_sources.end(); ++it) {
            if (it->number == number) {
                released = std::move(it->source);
                m_sources.erase(it);
                return;
            }
        }
    }

private:
    DWORD NextNumber() {
        if (m_next == 0) m_next = 1;
        return m_next++;
    }

    std::mutex m_lock;  // guards m_registrations, m_sources and m_next
    std::vector<Registration> m_registrations;
    std::vector<SourceEntry> m_sources;
    DWORD m_next = 1;
};

}  // namespace

HRESULT RegisterActiveObject(IUnknown* object, REFCLSID clsid, DWORD* registration) {
    return RunningObjectTable::Instance().Register(object, clsid, registration);
}

HRESULT RevokeActiveObject(DWORD registration) { return RunningObjectTable::Instance().Revoke(registration); }

HRESULT GetActiveObject(REFCLSID clsid, IUnknown** object) { return RunningObjectTable::Instance().Get(clsid, object); }

DWORD AddRunningObjectSource(std::shared_ptr<IRunningObjectSource> source) {
    return RunningObjectTable::Instance().AddSource(std::move(source));
}

void RemoveRunningObjectSource(DWORD number) { RunningObjectTable::Instance().RemoveSource(number); }
