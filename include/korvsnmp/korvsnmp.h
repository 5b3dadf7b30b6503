// libkorvsnmp: the appliance's resource statistics, from the collector
// daemon korvsnmpcd, named for users from the host's configuration.
#ifndef KORVSNMP_H
#define KORVSNMP_H

#include "fill_in_current_disk_io.h"
#include "fill_in_current_lun_io.h"
#include "fill_in_current_memory.h"
#include "fill_in_current_network.h"
#include "fill_in_current_space_io.h"
#include "parse_data.h"
#include "transmitor.h"

#endif
