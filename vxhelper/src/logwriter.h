#pragma once
// The helper library's records, through the writers its user set.

#include "vxhelper/logwriter.h"

void VX_WriteErrorRecord(const CString& text);
void VX_WriteInfoRecord(const CString& text);
