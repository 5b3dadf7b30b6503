// Every host platform operation and record that korvsnmp uses.
#ifndef KORV_PLATFORM_H
#define KORV_PLATFORM_H

#include "korv_core.h"
#include "korv_disk.h"
#include "korv_net.h"
#include "korv_storage.h"
#include "korv_webapi.h"

#endif
