#pragma once
// What a runtime stand-in simulates: projects, their variables and how each
// variable's value changes. Built in code or read from a project file (JSON,
// described in tarvo/README.md).

#include "platform/types.h"

#include <string>
#include <string_view>
#include <vector>

namespace tarvo {

enum class GeneratorKind {
    Constant,    // never changes on its own
    Sine,        // offset + amplitude * sin(2 pi t / cycle)
    Ramp,        // minimum up to maximum by step, then from minimum again
    RandomWalk,  // a random step of at most +-step, kept within minimum..maximum
    Counter,     // adds step at every change
    TextCycle,   // the next of its texts at every change
    StatusFlip,  // the status alternates between the initial and the alternate status
};

struct GeneratorConfig {
    GeneratorKind kind = GeneratorKind::Constant;
    double periodMs = 1000;    // time between two changes, simulated time
    double firstChangeMs = 0;  // simulated time of the first change; 0: one period after the start
    DWORD stopMs = 0;          // no changes after this simulated time; 0: never
    double amplitude = 1.0;
    double offset = 0.0;
    DWORD cycleMs = 60000;  // sine wave length
    double step = 1.0;
    double minimum = 0.0;
    double maximum = 100.0;
    std::vector<std::u16string> texts;
    ULONGLONG alternateStatus = 0;
    std::uint32_t seed = 1;
};

struct VariableConfig {
    std::u16string name;
    LONG id = 0;  // 0: the next free id of the project
    bool isText = false;
    double number = 0.0;   // initial value of a number variable
    std::u16string text;   // initial value of a text variable
    ULONGLONG status = 0;  // initial 64-bit status
    GeneratorConfig generator;
};

struct ProjectConfig {
    std::u16string name;
    bool active = true;
    std::vector<VariableConfig> variables;
};

struct RuntimeConfig {
    DWORD tickMs = 100;  // one bulk event per started container per tick, at most
    std::vector<ProjectConfig> projects;
};

// Checks a configuration and gives every variable without an id the next free
// one of its project. False with a message naming the culprit.
bool ValidateConfig(RuntimeConfig& config, std::string* error);
// Reads a project file; false with a message (file, place, problem).
bool LoadProjectFile(const std::string& path, RuntimeConfig* config, std::string* error);
bool ParseProjectJson(std::string_view json, RuntimeConfig* config, std::string* error);

}  // namespace tarvo
