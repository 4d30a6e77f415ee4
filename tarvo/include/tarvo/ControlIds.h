#pragma once
// The control object of a runtime stand-in (Runtime::ControlObject), as tools
// in other processes reach it: its class id and the DISPIDs of its methods.
// Header only. Booleans are BOOL or whole numbers; 64-bit statuses travel as
// their low and high 32 bits, as in change events.

#include "automation/dispatch.h"

constexpr CLSID CLSID_TarvoControl = {0x9B4E2C61, 0x7D3A, 0x4F0E, {0xA2, 0x5B, 0x61, 0xC8, 0x0D, 0x93, 0x4E, 0x17}};

namespace tarvo::control {

constexpr DISPID SetValue = 1;           // (project, variable, value): BOOL
constexpr DISPID SetValueFull = 2;       // (project, variable, value, status low, status high, time): BOOL
constexpr DISPID SetStatus = 3;          // (project, variable, status low, status high): BOOL
constexpr DISPID SetProjectActive = 4;   // (project, active): BOOL
constexpr DISPID FireRawBulkChange = 5;  // (project, container, array of variants, by reference): BOOL
constexpr DISPID SetRaiseError = 6;      // (object kind as ObjectKind's position, member DISPID, on)
constexpr DISPID SetRefusedName = 7;     // (variable, on)
constexpr DISPID SetStartFails = 8;      // (on)
constexpr DISPID SetAdviseFails = 9;     // (on)
constexpr DISPID SetLookupFails = 10;    // (on)
constexpr DISPID ClearFaults = 11;       // ()
constexpr DISPID Containers = 12;        // (project): array of arrays [name, started, sinks, names...]
constexpr DISPID VariableId = 13;        // (project, variable): I4, or VT_EMPTY for none
constexpr DISPID ProjectSinks = 14;      // (project): I4
constexpr DISPID LiveObjects = 15;       // (): I4, automation objects of the runtime still alive
constexpr DISPID SetDelivery = 16;       // (on the caller's thread)
constexpr DISPID SetPaused = 17;         // (paused)
constexpr DISPID Tick = 18;              // (): BOOL
constexpr DISPID Flush = 19;             // ()

}  // namespace tarvo::control
