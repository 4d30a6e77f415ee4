#pragma once
// Automation across processes of one user, over Unix-domain sockets.
//
// A server registers a running object under its class id; that makes a
// socket named after the class id in the socket folder. A client plugs a
// local-socket source into the running-object table (AddRunningObjectSource);
// GetActiveObject then connects to that socket and gives a proxy. The proxy's
// calls (IDispatch::Invoke, QueryInterface, connection points) are carried to
// the server's object; events come back to the client's sinks on a thread of
// the transport, never while the transport holds a lock.
//
// Arguments and results may be numbers, BOOL, CY, DATE, BSTR, objects,
// one-dimensional arrays of those or of variants, and by-reference forms;
// a by-reference argument arrives as a reference to the server's copy and
// carries nothing back.
//
// Only processes of the same user connect: the folder is the user's own
// (mode 0700) and both ends check the other's credentials. A call waits for
// its answer at most the call time-out. When the connection is lost, every
// call through its proxies fails at once with RPC_E_DISCONNECTED, and every
// proxy stays safe to release; a later GetActiveObject connects anew.

#include "automation/rot.h"

#include <functional>
#include <memory>
#include <string>

struct LocalSocketOptions {
    // Folder of the sockets. Empty: $SKYVANE_AUTOMATION_DIR when set, else
    // $XDG_RUNTIME_DIR/skyvane-automation, else /tmp/skyvane-automation-UID.
    std::string folder;
    DWORD callTimeoutMs = 30000;  // longest wait for the answer to one call (events included)
    DWORD frameTimeoutMs = 5000;  // longest wait for the rest of a frame once it has begun
    // Where refused clients, malformed frames and lost connections are reported; may be empty.
    std::function<void(const std::string&)> log;
    // Called when a connection is lost (the peer went away or sent garbage),
    // not when this side closed it; on a thread of the transport, with no lock
    // of it held. May be empty.
    std::function<void()> lost;
};

// The folder the options name (not created, not checked).
std::string LocalSocketFolder(const LocalSocketOptions& options);

// A source for AddRunningObjectSource that finds servers registered in the folder.
std::shared_ptr<IRunningObjectSource> CreateLocalSocketSource(LocalSocketOptions options = {});

// Makes object reachable from other processes of this user under clsid.
// Creates the folder (mode 0700) when missing; refuses a folder that is not
// the user's own or that others may enter. A socket left behind by a server
// that is gone is replaced; a running server of that class makes this fail.
// S_OK with a registration number (never 0), else a failure with a message.
HRESULT RegisterLocalServer(IUnknown* object, REFCLSID clsid, const LocalSocketOptions& options, DWORD* registration,
                            std::string* error = nullptr);
// Stops accepting, closes every connection of that registration (their
// proxies at the clients fail from then on) and removes the socket.
HRESULT RevokeLocalServer(DWORD registration);

// Proxies of this process that are still alive (for checks).
long LocalSocketProxyCount();
