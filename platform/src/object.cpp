#include "platform/object.h"

#include <cstring>
#include <new>

void* CCmdTarget::operator new(std::size_t size) {
    void* p = ::operator new(size);
    std::memset(p, 0, size);
    return p;
}

void CCmdTarget::operator delete(void* p) noexcept { ::operator delete(p); }
