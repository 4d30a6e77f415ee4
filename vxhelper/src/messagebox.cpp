#include "vxhelper/messagebox.h"

#include "platform/resources.h"

#include "logwriter.h"

#include <QApplication>
#include <QMessageBox>
#include <QThread>

#include <atomic>
#include <cstdio>
#include <mutex>

namespace {

std::mutex g_observerLock;  // guards g_observer and g_observerContext
VX_MessageBoxObserver g_observer = nullptr;
void* g_observerContext = nullptr;

void Observe(HWND parent, const CString& text, UINT type) {
    VX_MessageBoxObserver observer;
    void* context;
    {
        std::lock_guard<std::mutex> guard(g_observerLock);
        observer = g_observer;
        context = g_observerContext;
    }
    if (observer) observer(parent, text, type, context);
}

// A widget box needs a widget application and its thread.
bool CanShowWidgets() {
    auto* app = qobject_cast<QApplication*>(QCoreApplication::instance());
    return app && QThread::currentThread() == app->thread();
}

// The answer a box gives when nobody can be asked: the harmless one.
int DefaultAnswer(UINT buttons) {
    switch (buttons) {
    case MB_OKCANCEL:
    case MB_YESNOCANCEL: return IDCANCEL;
    case MB_YESNO: return IDNO;
    default: return IDOK;
    }
}

int ShowHeadless(const CString& text, UINT type) {
    std::fprintf(stderr, "%s\n", text.ToUtf8().c_str());
    std::fflush(stderr);
    VX_WriteErrorRecord(text);
    return DefaultAnswer(type & 0x0F);
}

QMessageBox::Icon IconOf(UINT type) {
    switch (type & 0xF0) {
    case MB_ICONERROR: return QMessageBox::Critical;
    case MB_ICONQUESTION: return QMessageBox::Question;
    case MB_ICONWARNING: return QMessageBox::Warning;
    case MB_ICONINFORMATION: return QMessageBox::Information;
    default: return QMessageBox::NoIcon;
    }
}

int ShowWidget(HWND parent, const CString& text, UINT type) {
    auto* parentWidget = static_cast<QWidget*>(GetNativeWidget(parent));
    QMessageBox box(IconOf(type), QCoreApplication::applicationName(), QString::fromStdU16String(text.Str()),
                    QMessageBox::NoButton, parentWidget);
    switch (type & 0x0F) {
    case MB_OKCANCEL: box.setStandardButtons(QMessageBox::Ok | QMessageBox::Cancel); break;
    case MB_YESNOCANCEL: box.setStandardButtons(QMessageBox::Yes | QMessageBox::No | QMessageBox::Cancel); break;
    case MB_YESNO: box.setStandardButtons(QMessageBox::Yes | QMessageBox::No); break;
    default: box.setStandardButtons(QMessageBox::Ok); break;
    }
    switch (box.exec()) {
    case QMessageBox::Yes: return IDYES;
    case QMessageBox::No: return IDNO;
    case QMessageBox::Cancel: return IDCANCEL;
    case QMessageBox::Ok: return IDOK;
    default: return DefaultAnswer(type & 0x0F);  // closed without a button
    }
}

}  // namespace

int VXHelper_MessageBox(HWND parent, UINT stringId, UINT type) {
    CString text;
    if (!AfxLoadString(stringId, text)) text = CString::Formatted(u"(string %u)", stringId);
    return VXHelper_MessageBox(parent, text, type);
}

int VXHelper_MessageBox(HWND parent, const CString& text, UINT type) {
    Observe(parent, text, type);
    return CanShowWidgets() ? ShowWidget(parent, text, type) : ShowHeadless(text, type);
}

void VXHelper_SetMessageBoxObserver(VX_MessageBoxObserver observer, void* context) {
    std::lock_guard<std::mutex> guard(g_observerLock);
    g_observer = observer;
    g_observerContext = context;
}
