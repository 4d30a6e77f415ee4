#pragma once
// Builds a dialog's widgets from its template: the dialog font, every control
// at its rectangle converted from dialog units to pixels by the font's base
// units, in tab order. Each control's object name is its id.

#include "platform/text.h"
#include "res/DialogTemplates.h"

#include <QDialog>
#include <QString>

#include <cstddef>

class QButtonGroup;

// The dialog font's base units, in pixels.
struct DialogBaseUnits {
    int x = 0;  // average character width
    int y = 0;  // character height
    int ToPixelsX(int dialogUnits) const;
    int ToPixelsY(int dialogUnits) const;
};

DialogBaseUnits BaseUnitsOf(const QFont& font);

// Gives the dialog its caption, font, fixed size and controls.
void BuildDialog(QDialog& dialog, const DlgTemplate& dlg);

// Applies a template's initial data (add-string entries for combo boxes).
// Stops at the closing zero word or at an entry that does not fit the data.
void ApplyDialogInit(QDialog& dialog, const unsigned char* data, std::size_t size);

// The control with this id.
template <typename T>
T* DialogControl(const QWidget& dialog, UINT id) {
    return dialog.findChild<T*>(QString::number(id));
}

inline QString ToQString(const CString& text) { return QString::fromStdU16String(text.Str()); }
inline CString ToCString(const QString& text) { return CString(text.toStdU16String()); }
