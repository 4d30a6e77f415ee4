#pragma once
// The automation objects the runtime hands to its clients.

#include "Engine.h"

namespace tarvo {

// The application object of a running engine.
CComPtr<IDispatch> CreateApplicationObject(std::shared_ptr<Engine> engine);
long LiveObjectCount();

}  // namespace tarvo
