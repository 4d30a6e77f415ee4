#pragma once
// The header of a sortable single-column list: remembers the sorted column
// and the direction and shows an arrow right of that column's title. Also
// the list operations that go with it: appending an item, and sorting.

#include "platform/text.h"

#include <QHeaderView>
#include <QPixmap>

#include <map>
#include <vector>

class QTreeWidget;

class CSortHeaderCtrl : public QHeaderView {
public:
    explicit CSortHeaderCtrl(QWidget* parent = nullptr);
    ~CSortHeaderCtrl() override;

    // Shows the arrow of the direction on the column and records both.
    // A column the header does not have changes nothing.
    void SetSortArrow(int column, bool descending);

    int GetSortColumn() const { return m_nSortColumn; }
    bool IsDescending() const { return m_bDescending; }
    // The image a column shows: 0 the down arrow, 1 the up arrow, -1 none.
    int GetColumnImage(int column) const;
    // The arrow images (0 down, 1 up) once created, their mask colour transparent.
    const std::vector<QPixmap>& GetImages() const { return m_images; }

protected:
    void paintSection(QPainter* painter, const QRect& rect, int logicalIndex) const override;

private:
    std::vector<QPixmap> m_images;     // created on the first SetSortArrow
    std::map<int, int> m_columnImage;  // column -> image shown in it
    int m_nSortColumn = -1;            // -1: none yet
    bool m_bDescending = false;
};

// Appends an item with the text at the end of the list; returns its index.
// The item's data (Qt::UserRole) is the list's item count after the insertion.
int AppendListItem(QTreeWidget& list, const CString& text);

// Orders two item texts: ignoring letter case, character by character,
// ascending unless descending. Negative, zero or positive.
int CompareListTexts(const CString& first, const CString& second, bool descending);

// Sorts the list's items by the text of their first column (CompareListTexts);
// items of equal text keep their order, selected items stay selected.
void SortList(QTreeWidget& list, bool descending);
