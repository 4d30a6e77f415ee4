#pragma once
// The runtime's automation surface as its clients see it: class and interface
// ids, and the DISPIDs of its objects' members and events. Header only, so a
// client needs no link to whatever plays the runtime.

#include "automation/dispatch.h"

// The application object, registered in the running-object table while the runtime runs.
constexpr CLSID CLSID_TarvoApplication = {0x47E95383, 0x0D06, 0x494C, {0x85, 0xDD, 0xDF, 0xBB, 0x23, 0x17, 0xDB, 0x5A}};
// Dispatch interfaces of the application, a project and an online variable container.
constexpr IID IID_ITarvoApplication = {0xE9CD095F, 0x6393, 0x4E72, {0x99, 0xB0, 0xF1, 0x77, 0x4B, 0xB7, 0xEA, 0x8D}};
constexpr IID IID_IProject = {0x6CA1C1FE, 0x654C, 0x43D7, {0x8C, 0xFB, 0xE7, 0x33, 0x00, 0x98, 0xA3, 0xF5}};
constexpr IID IID_IOnlineVariable = {0x1C80E850, 0x59F1, 0x4A94, {0xBF, 0x1B, 0x34, 0x91, 0xFB, 0x86, 0xB9, 0x65}};
// Event interfaces: a sink answers QueryInterface for these with its IDispatch.
constexpr IID DIID_IProjectEvents = {0x02850339, 0x13B4, 0x4938, {0x8D, 0x8C, 0x09, 0x66, 0x38, 0xEC, 0x58, 0x37}};
constexpr IID DIID_IOnlineVariableEvents = {0xB461BFC1,
                                            0x4112,
                                            0x440C,
                                            {0x8C, 0x8D, 0x14, 0x21, 0xA5, 0xBD, 0x59, 0xF7}};

namespace tarvo::dispid {

// Application
constexpr DISPID ApplicationProjects = 5;  // method: the projects collection

// Projects and variables collections
constexpr DISPID CollectionCount = 2;  // property get: I4
constexpr DISPID CollectionItem = 3;   // method (name as BSTR, or 0-based position): object or null

// Project
constexpr DISPID ProjectName = 2;        // property get: BSTR
constexpr DISPID ProjectVariables = 6;   // method: variables collection
constexpr DISPID ProjectContainers = 8;  // method: containers collection

// Variable
constexpr DISPID VariableId = 2;    // property get: I4, the key of change events
constexpr DISPID VariableName = 3;  // property get: BSTR

// Containers collection
constexpr DISPID ContainersCreate = 4;  // method (name): new online variable container
constexpr DISPID ContainersDelete = 5;  // method (name): BOOL; deletes that container

// Online variable container
constexpr DISPID ContainerReset = 13;  // method: BOOL; removes every name and stops
constexpr DISPID ContainerAdd = 5;     // method (variable name): BOOL, FALSE = not added
constexpr DISPID ContainerRemove = 6;  // method (variable name): BOOL
constexpr DISPID ContainerStart = 8;   // method: BOOL, nonzero = started, changes follow
constexpr DISPID ContainerStop = 9;    // method: no result

// Events
constexpr DISPID EventProjectActive = 1;       // project, no arguments
constexpr DISPID EventProjectInactive = 2;     // project, no arguments
constexpr DISPID EventVariableBulkChange = 2;  // container, six arguments (see below)

// "VariableBulkChange" arguments in their natural order, each a VARIANT passed
// by reference (VT_VARIANT|VT_BYREF): 1, the number of changes (I4); 2 to 6,
// zero-based one-dimensional arrays of equal length, element k of each
// describing one change: 2, variable ids (R8); 3, new values (VARIANT: R8 for
// numbers, BSTR for texts); 4, low 32 bits of the status (R8); 5, high 32 bits
// of the status (R8); 6, time stamps (R8 holding an OLE DATE, local time).
constexpr UINT BulkChangeArgCount = 6;

}  // namespace tarvo::dispid
