#include "logwriter.h"

#include <atomic>

namespace {

std::atomic<VX_LogWriter> g_error{nullptr};
std::atomic<VX_LogWriter> g_info{nullptr};

}  // namespace

void VXHelper_SetLogWriters(VX_LogWriter error, VX_LogWriter info) {
    g_error.store(error);
    g_info.store(info);
}

void VX_WriteErrorRecord(const CString& text) {
    if (VX_LogWriter writer = g_error.load()) writer(text);
}

void VX_WriteInfoRecord(const CString& text) {
    if (VX_LogWriter writer = g_info.load()) writer(text);
}
