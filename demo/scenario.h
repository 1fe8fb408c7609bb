// SPDX-License-Identifier: Apache-2.0
// The course of the demonstration inside the sandbox.
#ifndef VELD_DEMO_SCENARIO_H
#define VELD_DEMO_SCENARIO_H

#include <functional>
#include <string>

namespace demo {

/// Installs, enables, disables, and prints what is seen.
/// @param reportNamespace is called with the identity of each network namespace that is made on the way
/// @return number of results that are not as they must be
int runScenario(const std::string &buildDirectory, const std::function<void(const std::string &)> &reportNamespace);

}  // namespace demo

#endif
