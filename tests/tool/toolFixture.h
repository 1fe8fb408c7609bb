// SPDX-License-Identifier: Apache-2.0
// A sandbox with a small configuration, in which the tool runs.
#ifndef VELD_TEST_TOOLFIXTURE_H
#define VELD_TEST_TOOLFIXTURE_H

#include <gtest/gtest.h>
#include <json/value.h>

#include <string>
#include <vector>

#include "processes.h"

namespace veldtest {

/// Sets up the profiles "default" (active, firewall off) and "office", services, countries and the interface eth0.
class ToolTest : public testing::Test {
protected:
    void SetUp() override;
};

/// Runs the tool without a terminal.
ProgramResult runTool(const std::vector<std::string> &arguments);

/// The stored profile document of that name; null when there is none.
Json::Value storedProfile(const std::string &name);
Json::Value parseJson(const std::string &text);

}  // namespace veldtest

#endif
