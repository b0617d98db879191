#include "app/config_run_settings.h"
#include "app/run.h"
#include "config/input_list.h"
#include "platform/system.h"

namespace ox {

RunEnvironment defaultRunEnvironment() {
    RunEnvironment env;
    // The configuration, the input-list reader and the drivers plug in here as they arrive.
    env.makeSettings = [] { return std::make_unique<ConfigRunSettings>(); };
    env.loadInputList = loadInputList;
    env.processorCount = [] { return processorCount(); };
    return env;
}

}  // namespace ox
