// Stopping and starting instances round a transaction, by the product's control scripts, as the installer
// does it.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "transaction/record.h"

/// Stops the running instances of these products; what cannot be stopped is told. False when one still runs.
bool stopInstances(const Home &home, const std::vector<std::string> &products,
                   std::vector<std::string> &messages);

/// Starts those of the instances that do not run now, each as its recorded owner; what cannot be started is
/// told.
void startMissing(const Home &home, const std::vector<RecordedInstance> &wanted,
                  std::vector<std::string> &messages);
