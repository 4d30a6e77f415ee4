#include "ui/DialogBuilder.h"

#include <QButtonGroup>
#include <QComboBox>
#include <QFontMetrics>
#include <QFrame>
#include <QGroupBox>
#include <QHeaderView>
#include <QLabel>
#include <QLineEdit>
#include <QPushButton>
#include <QRadioButton>
#include <QRegularExpressionValidator>
#include <QTreeWidget>

#include <algorithm>
#include <cstring>

namespace {

// Rounded a * b / c, as dialog units are converted.
int MulDiv(int a, int b, int c) {
    const long long product = static_cast<long long>(a) * b;
    return static_cast<int>((product >= 0 ? product + c / 2 : product - c / 2) / c);
}

QWidget* MakeControl(QDialog& dialog, const DlgControl& control, QButtonGroup*& radioGroup) {
    const QString text = QString::fromUtf16(control.text);
    switch (control.kind) {
    case DlgControlKind::ListView: {
        auto* list = new QTreeWidget(&dialog);
        list->setRootIsDecorated(false);
        list->setItemsExpandable(false);
        list->setUniformRowHeights(true);
        list->setSelectionMode((control.style & kStyleSingleSel) ? QAbstractItemView::SingleSelection
                                                                 : QAbstractItemView::ExtendedSelection);
        list->setFrameShape(QFrame::StyledPanel);
        return list;
    }
    case DlgControlKind::PushButton:
    case DlgControlKind::DefPushButton: {
        auto* button = new QPushButton(text, &dialog);
        button->setAutoDefault(false);
        button->setDefault(control.kind == DlgControlKind::DefPushButton);
        return button;
    }
    case DlgControlKind::Label: {
        auto* label = new QLabel(text, &dialog);
        label->setAlignment(Qt::AlignLeft | Qt::AlignVCenter);
        return label;
    }
    case DlgControlKind::Edit: {
        auto* edit = new QLineEdit(&dialog);
        if (control.style & kStylePassword) edit->setEchoMode(QLineEdit::Password);
        if (control.style & kStyleNumber)
            edit->setValidator(new QRegularExpressionValidator(QRegularExpression(QStringLiteral("[0-9]*")), edit));
        return edit;
    }
    case DlgControlKind::RadioButton: {
        auto* radio = new QRadioButton(text, &dialog);
        if ((control.style & kStyleGroup) || !radioGroup) radioGroup = new QButtonGroup(&dialog);
        radioGroup->addButton(radio);
        return radio;
    }
    case DlgControlKind::ComboBox: {
        auto* combo = new QComboBox(&dialog);
        combo->setEditable(true);
        combo->setInsertPolicy(QComboBox::NoInsert);
        return combo;
    }
    case DlgControlKind::GroupBox: return new QGroupBox(text, &dialog);
    case DlgControlKind::EtchedLine: {
        auto* line = new QFrame(&dialog);
        line->setFrameShape(QFrame::HLine);
        line->setFrameShadow(QFrame::Sunken);
        return line;
    }
    }
    return nullptr;
}

}  // namespace

int DialogBaseUnits::ToPixelsX(int dialogUnits) const { return MulDiv(dialogUnits, x, 4); }
int DialogBaseUnits::ToPixelsY(int dialogUnits) const { return MulDiv(dialogUnits, y, 8); }

DialogBaseUnits BaseUnitsOf(const QFont& font) {
    const QFontMetrics metrics(font);
    const int width = metrics.horizontalAdvance(QStringLiteral("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz"));
    return {(width / 26 + 1) / 2, metrics.height()};
}

void BuildDialog(QDialog& dialog, const DlgTemplate& dlg) {
    dialog.setObjectName(QString::number(dlg.id));
    dialog.setWindowTitle(QString::fromUtf16(dlg.caption));
    QFont font(QString::fromUtf16(dlg.fontFace));
    font.setPointSize(dlg.fontPoints);
    dialog.setFont(font);
    const DialogBaseUnits units = BaseUnitsOf(dialog.font());
    dialog.setFixedSize(units.ToPixelsX(dlg.cx), units.ToPixelsY(dlg.cy));

    QButtonGroup* radioGroup = nullptr;
    QWidget* previous = nullptr;
    for (std::size_t i = 0; i < dlg.controlCount; ++i) {
        const DlgControl& control = dlg.controls[i];
        QWidget* widget = MakeControl(dialog, control, radioGroup);
        if (control.id != 0) widget->setObjectName(QString::number(control.id));
        int height = units.ToPixelsY(control.cy);
        // A combo box's height includes its drop-down list; closed, it is as high as its field.
        if (control.kind == DlgControlKind::ComboBox) height = std::min(height, widget->sizeHint().height());
        if (control.kind == DlgControlKind::EtchedLine) height = std::max(height, 2);
        widget->setGeometry(units.ToPixelsX(control.x), units.ToPixelsY(control.y), units.ToPixelsX(control.cx),
                            height);
        // Group boxes frame the controls listed before them: behind them, out of the tab order.
        if (control.kind == DlgControlKind::GroupBox) {
            widget->lower();
            continue;
        }
        if (widget->focusPolicy() == Qt::NoFocus) continue;
        if (previous) QWidget::setTabOrder(previous, widget);
        previous = widget;
    }
}

void ApplyDialogInit(QDialog& dialog, const unsigned char* data, std::size_t size) {
    constexpr unsigned kAddString = 0x0403;
    std::size_t at = 0;
    while (at + 2 <= size) {
        const unsigned id = data[at] | data[at + 1] << 8;
        if (id == 0 || at + 8 > size) return;
        const unsigned message = data[at + 2] | data[at + 3] << 8;
        const std::size_t length = data[at + 4] | data[at + 5] << 8 | static_cast<std::size_t>(data[at + 6]) << 16 |
                                   static_cast<std::size_t>(data[at + 7]) << 24;
        at += 8;
        if (length > size - at) return;
        const auto* text = reinterpret_cast<const char*>(data + at);
        const std::size_t textLength = strnlen(text, length);
        if (message == kAddString) {
            if (auto* combo = DialogControl<QComboBox>(dialog, id))
                combo->addItem(QString::fromLatin1(text, static_cast<qsizetype>(textLength)));
        }
        at += length;
    }
}
