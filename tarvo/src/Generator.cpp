// How the simulated variables change.
#include "Engine.h"

#include <algorithm>
#include <cmath>
#include <numbers>

namespace tarvo {

namespace {

void SetNumber(VariableState& v, double number) {
    v.number = number;
    v.value = CComVariant(number);
}

}  // namespace

void StartGenerator(VariableState& v) {
    const GeneratorConfig& g = v.config.generator;
    v.status = v.config.status;
    v.value = v.config.isText ? CComVariant(std::u16string_view(v.config.text)) : CComVariant(v.config.number);
    v.number = v.config.number;
    v.time = NowAsOleDate();
    v.random.seed(g.seed + static_cast<std::uint32_t>(v.config.id));
    v.nextChangeMs = g.firstChangeMs > 0 ? g.firstChangeMs : g.periodMs;
    // A text cycle goes on after the initial text when that is one of its texts.
    const auto it = std::find(g.texts.begin(), g.texts.end(), v.config.text);
    v.textIndex = it == g.texts.end() ? 0 : static_cast<size_t>(it - g.texts.begin()) + 1;
}

bool AdvanceGenerator(VariableState& v, ULONGLONG nowMs) {
    const GeneratorConfig& g = v.config.generator;
    if (g.kind == GeneratorKind::Constant || static_cast<double>(nowMs) < v.nextChangeMs) return false;
    if (g.stopMs > 0 && nowMs > g.stopMs) return false;
    // One change per due tick; a period shorter than the tick changes once per tick.
    while (v.nextChangeMs <= static_cast<double>(nowMs)) v.nextChangeMs += g.periodMs;
    switch (g.kind) {
    case GeneratorKind::Constant: return false;
    case GeneratorKind::Sine:
        SetNumber(v, g.offset + g.amplitude * std::sin(2 * std::numbers::pi * static_cast<double>(nowMs % g.cycleMs) /
                                                       static_cast<double>(g.cycleMs)));
        break;
    case GeneratorKind::Ramp: {
        const double next = v.number + g.step;
        SetNumber(v, next > g.maximum || next < g.minimum ? g.minimum : next);
        break;
    }
    case GeneratorKind::RandomWalk: {
        std::uniform_real_distribution<double> delta(-g.step, g.step);
        SetNumber(v, std::clamp(v.number + delta(v.random), g.minimum, g.maximum));
        break;
    }
    case GeneratorKind::Counter: SetNumber(v, v.number + g.step); break;
    case GeneratorKind::TextCycle:
        v.value = CComVariant(std::u16string_view(g.texts[v.textIndex % g.texts.size()]));
        v.textIndex = (v.textIndex + 1) % g.texts.size();
        break;
    case GeneratorKind::StatusFlip:
        v.status = v.status == g.alternateStatus ? v.config.status : g.alternateStatus;
        break;
    }
    v.time = NowAsOleDate();
    return true;
}

}  // namespace tarvo
