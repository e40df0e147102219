// A plug-in as the daemon knows it: the registry-backed record, declared in
// QVDRegistryPlugIn.h. Users that only pass plug-ins around include this
// name.
#pragma once

#include "qvd/QVDRegistryPlugIn.h"
