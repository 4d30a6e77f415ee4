#pragma once
// The module's dialog templates: caption, font, size and every control with
// its rectangle in dialog units, in tab order. The dialogs build their
// widgets from them (ui/DialogBuilder.h).

#include "platform/types.h"

#include <cstddef>

enum class DlgControlKind {
    ListView,  // report view
    PushButton,
    DefPushButton,
    Label,
    Edit,
    RadioButton,  // automatic
    ComboBox,     // drop-down with an edit field
    GroupBox,
    EtchedLine,
};

// Control styles that matter here.
enum DlgControlStyle : UINT {
    kStyleNone = 0,
    kStyleSingleSel = 1u << 0,    // list view: one selected item at most
    kStyleAutoHScroll = 1u << 1,  // edit: scrolls horizontally
    kStyleNumber = 1u << 2,       // edit: digits only
    kStylePassword = 1u << 3,     // edit: shows no characters
    kStyleGroup = 1u << 4,        // radio button: starts a group
    kStyleVScroll = 1u << 5,      // combo box: vertical scroll bar
};

struct DlgControl {
    UINT id;  // 0: a static control without an id
    DlgControlKind kind;
    const char16_t* text;
    int x, y, cx, cy;  // dialog units
    UINT style;
};

struct DlgTemplate {
    UINT id;
    const char16_t* caption;
    const char16_t* fontFace;
    int fontPoints;
    int cx, cy;                  // dialog units
    const DlgControl* controls;  // tab order
    std::size_t controlCount;
};

extern const DlgTemplate kKonfigDialog;      // IDD_KONFIG
extern const DlgTemplate kConnectionDialog;  // IDD_CONNECTION

// Initial data of IDD_CONNECTION: add-string entries for the format combo box.
// Each entry: control id (2 bytes), message (2 bytes, 0x0403), data length
// (4 bytes), the text with its zero, padded to that length; a zero word ends it.
extern const unsigned char kConnectionDialogInit[];
extern const std::size_t kConnectionDialogInitSize;
