#include "ui/SortHeaderCtrl.h"

#include "res/SortArrows.h"
#include "ui/DialogBuilder.h"

#include <QBitmap>
#include <QImage>
#include <QPainter>
#include <QStyle>
#include <QTreeWidget>

#include <algorithm>

namespace {

constexpr int kArrowGap = 6;  // pixels between a title and its arrow

QPixmap LoadArrow(const char* const* xpm) {
    QPixmap pixmap(xpm);
    pixmap.setMask(pixmap.createMaskFromColor(QColor(QRgb(kSortArrowMaskColour)), Qt::MaskInColor));
    return pixmap;
}

}  // namespace

CSortHeaderCtrl::CSortHeaderCtrl(QWidget* parent) : QHeaderView(Qt::Horizontal, parent) {
    setSectionsClickable(true);
    setHighlightSections(false);
    setDefaultAlignment(Qt::AlignLeft | Qt::AlignVCenter);
}

CSortHeaderCtrl::~CSortHeaderCtrl() = default;

void CSortHeaderCtrl::SetSortArrow(int column, bool descending) {
    if (m_images.empty()) {
        m_images.push_back(LoadArrow(kSortDownXpm));  // image 0: IDB_SORT_DOWN
        m_images.push_back(LoadArrow(kSortUpXpm));    // image 1: IDB_SORT_UP
    }
    if (m_nSortColumn >= 0) m_columnImage.erase(m_nSortColumn);
    if (column < 0 || column >= count()) {
        viewport()->update();
        return;
    }
    m_columnImage[column] = descending ? 0 : 1;
    m_nSortColumn = column;
    m_bDescending = descending;
    viewport()->update();
}

int CSortHeaderCtrl::GetColumnImage(int column) const {
    const auto it = m_columnImage.find(column);
    return it == m_columnImage.end() ? -1 : it->second;
}

void CSortHeaderCtrl::paintSection(QPainter* painter, const QRect& rect, int logicalIndex) const {
    QHeaderView::paintSection(painter, rect, logicalIndex);
    const int image = GetColumnImage(logicalIndex);
    if (image < 0 || image >= static_cast<int>(m_images.size())) return;
    const QPixmap& arrow = m_images[static_cast<size_t>(image)];
    const QString title = model() ? model()->headerData(logicalIndex, orientation()).toString() : QString();
    const int margin = style()->pixelMetric(QStyle::PM_HeaderMargin, nullptr, this);
    const int right = rect.right() - margin - arrow.width();
    const int x = std::min(rect.left() + margin + fontMetrics().horizontalAdvance(title) + kArrowGap, right);
    if (x < rect.left()) return;
    painter->save();
    painter->setClipRect(rect);  // the style may leave the painter clipped to the title
    painter->drawPixmap(x, rect.top() + (rect.height() - arrow.height()) / 2, arrow);
    painter->restore();
}

int AppendListItem(QTreeWidget& list, const CString& text) {
    const int index = list.topLevelItemCount();
    auto* item = new QTreeWidgetItem(QStringList{ToQString(text)});
    list.insertTopLevelItem(index, item);
    item->setData(0, Qt::UserRole, list.topLevelItemCount());
    return index;
}

int CompareListTexts(const CString& first, const CString& second, bool descending) {
    return descending ? second.CompareNoCase(first) : first.CompareNoCase(second);
}

void SortList(QTreeWidget& list, bool descending) {
    // Items are found by their own texts: item data may repeat after deletions.
    struct Entry {
        QTreeWidgetItem* item;
        CString text;
        bool selected;
    };
    // Taking items out and back changes no selection the user made: no signal.
    const QSignalBlocker blocker(list.selectionModel());
    std::vector<Entry> entries;
    QTreeWidgetItem* current = list.currentItem();
    while (list.topLevelItemCount() > 0) {
        QTreeWidgetItem* item = list.topLevelItem(0);
        entries.push_back({item, ToCString(item->text(0)), item->isSelected()});
        list.takeTopLevelItem(0);
    }
    std::stable_sort(entries.begin(), entries.end(), [descending](const Entry& a, const Entry& b) {
        return CompareListTexts(a.text, b.text, descending) < 0;
    });
    for (const Entry& entry : entries) list.addTopLevelItem(entry.item);
    if (current) list.setCurrentItem(current, 0, QItemSelectionModel::NoUpdate);
    for (const Entry& entry : entries) entry.item->setSelected(entry.selected);
}
