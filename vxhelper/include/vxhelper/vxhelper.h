#pragma once
// The helper library in one include.

#include "vxhelper/aescrypt.h"
#include "vxhelper/dirmanager.h"
#include "vxhelper/logwriter.h"
#include "vxhelper/messagebox.h"
#include "vxhelper/profile.h"
#include "vxhelper/thread.h"
#include "vxhelper/variant.h"
