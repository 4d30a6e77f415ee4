#pragma once
// What the module object offers the runtime bridge.

#include "platform/text.h"

class CVarItem;

class IMainAzureAccess {
public:
    virtual ~IMainAzureAccess() = default;
    // Queues a snapshot of an item whose value has just changed (window thread).
    virtual void QueueValueChange(CVarItem* item) = 0;
    virtual void LogError(const CString& text) = 0;
    virtual void LogInfo(const CString& text) = 0;
    // Asks for the configured variables to be subscribed again, soon, on the window's thread.
    virtual bool RequestVariableCheck() = 0;
};
