#pragma once
// The command line of skyvane-gateway: what it asks for, and the manual page
// that --help prints.

#include <string>
#include <vector>

enum class GatewayCommand { Run, Configure, Help, Version };

struct GatewayOptions {
    GatewayCommand command = GatewayCommand::Run;
    std::string iniFile;       // --ini, as given
    std::string projectFile;   // --simulate: start the runtime stand-in with this project file
    double simulateDelay = 0;  // --simulate-delay: seconds before the stand-in starts
    double duration = 0;       // --duration: seconds to run, 0 until a signal
    double statusInterval = 10;
    std::string metricsFile;
    std::string modulePath;  // --module; empty: libSkyvane.so beside the program
};

// Reads the arguments after the program name. False with one line saying what
// is wrong; the caller exits with 2.
bool ParseGatewayOptions(const std::vector<std::string>& arguments, GatewayOptions& options, std::string& error);

// The manual page printed by --help.
const char* GatewayManual();
