#include "res/DialogTemplates.h"

#include "res/resource.h"

namespace {

using K = DlgControlKind;

constexpr DlgControl kKonfigControls[] = {
    {IDC_LIST_PROJECTS, K::ListView, u"", 16, 33, 124, 103, kStyleSingleSel},
    {IDC_LIST_VARIABLES, K::ListView, u"", 148, 33, 124, 103, kStyleNone},
    {IDC_ADD_VARIABLES, K::PushButton, u">", 280, 60, 20, 16, kStyleNone},
    {IDC_REMOVE_VARIABLES, K::PushButton, u"<", 280, 92, 20, 16, kStyleNone},
    {IDC_LIST_EXPORTED, K::ListView, u"", 308, 33, 248, 103, kStyleNone},
    {0, K::Label, u"Available in SCADA", 16, 20, 116, 12, kStyleNone},
    {0, K::Label, u"Exported into MS Azure ", 308, 20, 144, 12, kStyleNone},
    {IDC_LIST_CONNECTIONS, K::ListView, u"", 12, 164, 480, 56, kStyleNone},
    {IDC_NEW_CONNECTION, K::PushButton, u"New...", 500, 164, 52, 16, kStyleNone},
    {IDC_EDIT_CONNECTION, K::PushButton, u"Edit...", 500, 184, 52, 16, kStyleNone},
    {IDC_DELETE_CONNECTION, K::PushButton, u"Delete", 500, 204, 52, 16, kStyleNone},
    {0, K::Label, u"Integrity period", 16, 248, 88, 12, kStyleNone},
    {0, K::Label, u"s", 50, 261, 8, 12, kStyleNone},
    {IDC_INTEGRITY_PERIOD, K::Edit, u"", 16, 261, 30, 12, kStyleNumber},
    {0, K::Label, u"HTTP Proxy Domain", 16, 276, 180, 12, kStyleNone},
    {IDC_PROXY_DOMAIN, K::Edit, u"", 16, 288, 180, 12, kStyleAutoHScroll},
    {0, K::Label, u"HTTP Proxy User", 204, 276, 180, 12, kStyleNone},
    {IDC_PROXY_USER, K::Edit, u"", 204, 288, 180, 12, kStyleAutoHScroll},
    {0, K::Label, u"HTTP Proxy Password", 16, 304, 180, 12, kStyleNone},
    {IDC_PROXY_PASSWORD, K::Edit, u"", 16, 316, 180, 12, kStylePassword},
    {0, K::Label, u"Confirm HTTP Proxy Password ", 204, 304, 180, 12, kStyleNone},
    {IDC_PROXY_PASSWORD_CONFIRM, K::Edit, u"", 204, 316, 180, 12, kStylePassword},
    {IDC_OK, K::DefPushButton, u"OK", 456, 356, 52, 16, kStyleNone},
    {IDC_CANCEL, K::PushButton, u"Cancel", 512, 356, 52, 16, kStyleNone},
    {0, K::GroupBox, u"Variables", 8, 8, 556, 136, kStyleNone},
    {0, K::GroupBox, u"MS Azure Connections", 8, 152, 556, 76, kStyleNone},
    {0, K::GroupBox, u"MS Azure Settings", 8, 236, 556, 104, kStyleNone},
    {0, K::EtchedLine, u"", 0, 348, 572, 1, kStyleNone},
};

constexpr DlgControl kConnectionControls[] = {
    {0, K::Label, u"MS Azure Connection", 8, 8, 136, 12, kStyleNone},
    {IDC_CONNECTION_TEXT, K::Edit, u"", 8, 21, 240, 12, kStyleAutoHScroll},
    {0, K::Label, u"Service Bus Queue / Event Hub Name", 8, 40, 180, 12, kStyleNone},
    {IDC_CONNECTION_QUEUE, K::Edit, u"", 8, 53, 240, 12, kStyleAutoHScroll},
    {IDC_MODE_QUEUE, K::RadioButton, u"Queue", 16, 72, 60, 8, kStyleGroup},
    {IDC_MODE_EVENTHUB, K::RadioButton, u"Event Hub", 80, 72, 72, 8, kStyleNone},
    {0, K::Label, u"Format", 8, 88, 92, 12, kStyleNone},
    {IDC_FORMAT, K::ComboBox, u"", 8, 101, 60, 30, kStyleVScroll},
    {IDC_OK, K::DefPushButton, u"OK", 140, 128, 52, 16, kStyleNone},
    {IDC_CANCEL, K::PushButton, u"Cancel", 196, 128, 52, 16, kStyleNone},
    {0, K::EtchedLine, u"", 0, 120, 256, 1, kStyleNone},
};

}  // namespace

const DlgTemplate kKonfigDialog = {
    IDD_KONFIG, u"Settings", u"MS Sans Serif", 8,
    572,        380,         kKonfigControls,  sizeof(kKonfigControls) / sizeof(kKonfigControls[0])};

const DlgTemplate kConnectionDialog = {IDD_CONNECTION,
                                       u"MS Azure Connection Settings",
                                       u"MS Shell Dlg",
                                       8,
                                       256,
                                       152,
                                       kConnectionControls,
                                       sizeof(kConnectionControls) / sizeof(kConnectionControls[0])};

// 2005 = 0x07D5, add string = 0x0403, lengths little-endian.
const unsigned char kConnectionDialogInit[] = {
    0xD5, 0x07, 0x03, 0x04, 4, 0,    0,    0,    'X',  'M', 'L', 0, 0xD5, 0x07, 0x03, 0x04, 6,   0, 0, 0, 'J',
    'S',  'O',  'N',  0,    0, 0xD5, 0x07, 0x03, 0x04, 6,   0,   0, 0,    'B',  'O',  'N',  'D', 0, 0, 0, 0,
};
const std::size_t kConnectionDialogInitSize = sizeof(kConnectionDialogInit);
