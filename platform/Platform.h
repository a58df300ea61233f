// Every facility that the service takes from the platform, handed down from the composition root, which owns them all
// and outlives the service. Nothing in the service looks a facility up in any other way.
#pragma once

#include "platform/Beacon.h"
#include "platform/Clock.h"
#include "platform/DeviceProperties.h"
#include "platform/FileSystem.h"
#include "platform/HwStats.h"
#include "platform/Joule.h"
#include "platform/JsonWriting.h"
#include "platform/Malady.h"
#include "platform/Metricsheet.h"
#include "platform/Notifications.h"
#include "platform/Preferences.h"
#include "platform/Probe.h"
#include "platform/ProcessControl.h"
#include "platform/ProcessInformation.h"
#include "platform/PropertyListReading.h"
#include "platform/Spoor.h"
#include "platform/Tally.h"
#include "platform/Telem.h"
#include "platform/WorkQueue.h"

namespace vela::platform {

struct Platform {
    Beacon& beacon;
    Clock& clock;
    DeviceProperties& deviceProperties;
    FileSystem& fileSystem;
    HwStats& hwStats;
    Joule& joule;
    JsonWriting& jsonWriting;
    Malady& malady;
    Metricsheet& metricsheet;
    Notifications& notifications;
    Preferences& preferences;
    Probe& probe;
    ProcessControl& processControl;
    ProcessInformation& processInformation;
    PropertyListReading& propertyListReading;
    Spoor& spoor;
    Tally& tally;
    Telem& telem;
    WorkQueues& workQueues;
};

} // namespace vela::platform
