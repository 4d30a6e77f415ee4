// Project files: the shipped example, and bad files giving clear errors.
#include "tarvo/Config.h"

#include <gtest/gtest.h>

#include <cstdlib>

using tarvo::GeneratorKind;

namespace {

// Parses and expects a failure whose message mentions `needle`.
void ExpectRejected(const std::string& json, const std::string& needle) {
    tarvo::RuntimeConfig config;
    std::string error;
    EXPECT_FALSE(tarvo::ParseProjectJson(json, &config, &error)) << json;
    EXPECT_NE(error.find(needle), std::string::npos) << "message: " << error;
}

std::string OneVariable(const std::string& variable) {
    return R"({"projects": [{"name": "P", "variables": [)" + variable + "]}]}";
}

}  // namespace

TEST(ProjectFile, ShippedExampleLoads) {
    const char* top = std::getenv("SKYVANE_SOURCE_DIR");
    ASSERT_NE(top, nullptr) << "SKYVANE_SOURCE_DIR is not set";
    tarvo::RuntimeConfig config;
    std::string error;
    ASSERT_TRUE(tarvo::LoadProjectFile(std::string(top) + "/tarvo/examples/plant.json", &config, &error)) << error;
    ASSERT_EQ(config.projects.size(), 2u);
    const auto& plant = config.projects[0];
    EXPECT_EQ(plant.name, u"Plant");
    EXPECT_EQ(plant.variables.size(), 10u);  // "Line{n}.Count" repeated 4 times
    EXPECT_EQ(plant.variables[5].name, u"Line1.Count");
    EXPECT_EQ(plant.variables[8].name, u"Line4.Count");
    EXPECT_EQ(plant.variables[4].generator.kind, GeneratorKind::StatusFlip);
    EXPECT_EQ(plant.variables[4].generator.alternateStatus, 0x0000000100000004ull);
    EXPECT_EQ(plant.variables[3].generator.texts.size(), 4u);
    EXPECT_EQ(config.projects[1].variables[0].id, 100);
    EXPECT_EQ(config.projects[1].variables[1].id, 1);
}

TEST(ProjectFile, DefaultsAndIds) {
    tarvo::RuntimeConfig config;
    std::string error;
    ASSERT_TRUE(tarvo::ParseProjectJson(
        R"({"projects": [{"name": "P", "active": false, "variables": [
             {"name": "a", "id": 2}, {"name": "b"}, {"name": "c{n}", "repeat": 2, "id": 5},
             {"name": "t", "type": "text", "value": "x", "status": "18446744073709551615"}]}]})",
        &config, &error))
        << error;
    EXPECT_EQ(config.tickMs, 100u);
    const auto& p = config.projects[0];
    EXPECT_FALSE(p.active);
    ASSERT_EQ(p.variables.size(), 5u);
    EXPECT_EQ(p.variables[0].id, 2);
    EXPECT_EQ(p.variables[1].id, 1);  // the first free id
    EXPECT_EQ(p.variables[2].id, 5);
    EXPECT_EQ(p.variables[3].id, 6);
    EXPECT_EQ(p.variables[4].id, 3);
    EXPECT_EQ(p.variables[4].text, u"x");
    EXPECT_EQ(p.variables[4].status, ~0ull);
    EXPECT_EQ(p.variables[1].generator.kind, GeneratorKind::Constant);
    EXPECT_EQ(p.variables[1].generator.phaseMs, 0u);

    ASSERT_TRUE(tarvo::ParseProjectJson(
        OneVariable(R"({"name": "a", "generator": {"kind": "counter", "period_ms": 500, "phase_ms": 300}})"), &config,
        &error))
        << error;
    EXPECT_EQ(config.projects[0].variables[0].generator.periodMs, 500u);
    EXPECT_EQ(config.projects[0].variables[0].generator.phaseMs, 300u);
}

TEST(ProjectFile, BadFilesAreRejectedWithTheReason) {
    ExpectRejected("{", "not valid JSON");
    ExpectRejected("[]", "one JSON object");
    ExpectRejected(R"({"projects": {}})", "\"projects\" must be an array");
    ExpectRejected(R"({"tick_ms": 0, "projects": []})", "tick_ms");
    ExpectRejected(R"({"tick_ms": 1.5, "projects": []})", "whole number");
    ExpectRejected(R"({"projcts": []})", "unknown key \"projcts\"");
    ExpectRejected(R"({"projects": [{"name": "P", "variables": []}, {"name": "P", "variables": []}]})", "used twice");
    ExpectRejected(OneVariable(R"({"name": "a"}, {"name": "a"})"), "used twice");
    ExpectRejected(OneVariable(R"({"name": "a", "id": 3}, {"name": "b", "id": 3})"), "id is used twice");
    ExpectRejected(OneVariable(R"({"name": ""})"), "no name");
    ExpectRejected(OneVariable(R"({"name": "a", "type": "bool"})"), "\"type\"");
    ExpectRejected(OneVariable(R"({"name": "a", "value": "text"})"), "\"value\" must be a number");
    ExpectRejected(OneVariable(R"({"name": "a", "status": -1})"), "\"status\"");
    ExpectRejected(OneVariable(R"({"name": "a", "status": "0xZZ"})"), "\"status\"");
    ExpectRejected(OneVariable(R"({"name": "a", "repeat": 3})"), "{n}");
    ExpectRejected(OneVariable(R"({"name": "a{n}", "repeat": 0})"), "repeat");
    ExpectRejected(OneVariable(R"({"name": "a{n}", "repeat": 2, "id": 2147483647})"), "past");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "sinus"}})"), "unknown \"kind\" \"sinus\"");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "sine", "period_ms": 0}})"), "period_ms");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "sine", "phase_ms": -5}})"), "phase_ms");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "text_cycle", "texts": ["x"]}})"),
                   "needs a text variable");
    ExpectRejected(OneVariable(R"({"name": "a", "type": "text", "generator": {"kind": "text_cycle"}})"),
                   "at least one text");
    ExpectRejected(OneVariable(R"({"name": "a", "type": "text", "generator": {"kind": "counter"}})"),
                   "needs a number variable");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "ramp", "min": 5, "max": 1}})"), "min");
    ExpectRejected(OneVariable(R"({"name": "a", "generator": {"kind": "ramp", "texts": [1]}})"), "texts");

    tarvo::RuntimeConfig config;
    std::string error;
    EXPECT_FALSE(tarvo::LoadProjectFile("no/such/file.json", &config, &error));
    EXPECT_NE(error.find("no/such/file.json"), std::string::npos) << error;
}
