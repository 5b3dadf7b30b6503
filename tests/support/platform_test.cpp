#include "platform_test.h"

#include "syslog_capture.h"

namespace korvtest {

void DescribeEnglishTexts(korvstandin::HostDescription &host)
{
    host.files[korvstandin::kStringsFilePath]["volume"] = {{"volume_disk", "Disk"},
                                                          {"volume_expansion", "Expansion Unit"},
                                                          {"dedicated_ssd_cache", "SSD Cache"}};
}

void FreshPlatform()
{
    korvstandin::Reset();
    DescribeEnglishTexts(korvstandin::Host());
    ClearLog();
}

}  // namespace korvtest
