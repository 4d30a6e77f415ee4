#include "Backoff.h"

#include <algorithm>

int CBackoff::NextPauseMs() {
    const int pause = m_nNextMs;
    m_nNextMs = std::min(m_nNextMs * 2, kLongestMs);
    return pause;
}
