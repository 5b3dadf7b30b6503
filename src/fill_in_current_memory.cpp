// The memory section of the statistics result.
#include "korvsnmp/fill_in_current_memory.h"

#include <utility>

#include <korv_core.h>

#include "json_read.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "fill_in_current_memory";
constexpr char kTotalRealKey[] = "total_real";
constexpr char kMemorySizeKey[] = "memory_size";

}  // namespace

namespace KORVSNMP {

bool FillInCurrentMemory(const Json::Value &record, Json::Value &memory)
{
    if (!korvread::IsRecord(record)) {
        KORVSNMP_LOG(LOG_ERR, "Memory record is not an object");
        return false;
    }
    if (!record.isMember(kTotalRealKey)) {
        KORVSNMP_LOG(LOG_ERR, "Memory TotalReal not exist.");
        memory = record;
        return false;
    }
    unsigned int totalReal = 0;
    if (!korvread::ReadUInt32(record[kTotalRealKey], totalReal)) {
        KORVSNMP_LOG(LOG_ERR, "Memory: \"%s\" is not an unsigned 32-bit number", kTotalRealKey);
        return false;
    }

    const unsigned int physMemSize = KLIBSystemPhysMemSizeGet();
    Json::Value filled = record;
    filled[kMemorySizeKey] = physMemSize != 0 ? physMemSize : totalReal;
    memory = std::move(filled);
    return true;
}

}  // namespace KORVSNMP
