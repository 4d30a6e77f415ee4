#include "runtime/RefCounting.h"

int VX_CRefCnt::Release(int n) {
    if (n < 0 || !IsReferenced()) return m_nRefCount;
    m_nRefCount = n >= m_nRefCount ? 0 : m_nRefCount - n;
    if (!IsReferenced()) {
        OnLastRelease();
        return 0;
    }
    return m_nRefCount;
}

int VX_CRefCnt::AddRef() {
    const bool wasReferenced = IsReferenced();
    ++m_nRefCount;
    if (!wasReferenced && IsReferenced()) OnFirstReference();
    return m_nRefCount;
}

int VX_CRef::AddRef() {
    ++m_nHeld;
    m_pRefCnt->AddRef();
    return m_nHeld;
}

void VX_CRef::ReleaseAll() {
    if (m_pRefCnt) m_pRefCnt->Release(m_nHeld);
    m_nHeld = 0;
    m_pRefCnt = nullptr;
}
