#pragma once
// The sort arrows of the list headers, 9 x 11 pixels in XPM form. Magenta
// (#800080) is the mask colour: those pixels are transparent once shown.

// IDB_SORT_UP: ascending.
inline const char* const kSortUpXpm[] = {
    "9 11 4 1",  ". c #800080", "g c #808080", "s c #C0C0C0", "w c #FFFFFF", ".........", ".........", "....g....",
    "...gsw...", "...gsw...",   "..gsssw..",   "..gsssw..",   ".gsssssw.",   ".gsssssw.", "gwwwwwwww", ".........",
};

// IDB_SORT_DOWN: descending.
inline const char* const kSortDownXpm[] = {
    "9 11 4 1",  ". c #800080", "g c #808080", "s c #C0C0C0", "w c #FFFFFF", ".........", ".........", "ggggggggw",
    ".gsssssw.", ".gsssssw.",   "..gsssw..",   "..gsssw..",   "...gsw...",   "...gsw...", "....w....", ".........",
};

constexpr unsigned kSortArrowMaskColour = 0x800080;  // RGB(128, 0, 128)
