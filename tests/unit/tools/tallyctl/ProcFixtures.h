// Texts as a kernel writes them, at two times one second apart.
#pragma once

#include <string_view>

namespace tallyd::tallyctl {

inline constexpr std::string_view kStatBefore = R"(cpu  1000 100 400 8000 50 30 20 10 5 0
cpu0 500 50 200 4000 25 15 10 5 5 0
cpu1 500 50 200 4000 25 15 10 5 0 0
intr 1048576 0 9 0
ctxt 4033322
btime 1700000000
)";
inline constexpr std::string_view kStatAfter = R"(cpu  1040 110 420 8110 60 33 27 10 5 0
cpu0 520 55 210 4055 30 16 13 5 5 0
)";

inline constexpr std::string_view kMeminfo = R"(MemTotal:       24684084 kB
MemFree:        23281784 kB
MemAvailable:   18513063 kB
Buffers:            6632 kB
SwapCached:            0 kB
SwapTotal:       2097148 kB
SwapFree:        1048572 kB
HugePages_Total:       0
)";

inline constexpr std::string_view kDiskstatsBefore =
    R"(   7       0 loop0 11 0 22 0 0 0 0 0 0 0 0 0 0 0 0 0 0
   1       0 ram0 5 0 5 0 5 0 5 0 0 0 0
 259       0 nvme0n1 1000 12 20000 41883 500 10 4000 6292 0 8384 49119 11051 50 2663528 910 1077 33
 259       1 nvme0n1p1 900 12 18000 41883 500 10 4000 6292 0 8384 49119 11051 50 2663528 910 1077 33
   8       0 sda 10 0 100 0 20 0 200 0 0 0 0
   8       1 sda1 9 0 90 0 19 0 190 0 0 0 0
   8      16 sda2x 1 0 2 0 3 0 4 0 0 0 0
 253       0 dm-0 700 0 700 0 700 0 700 0 0 0 0
   9     127 md127 700 0 700 0 700 0 700 0 0 0 0
)";
inline constexpr std::string_view kDiskstatsAfter =
    R"( 259       0 nvme0n1 1010 12 20080 41883 504 10 4016 6292 0 8384 49119 11051 50 2663528 910 1077 33
 259       1 nvme0n1p1 910 12 18080 41883 504 10 4016 6292 0 8384 49119 11051 50 2663528 910 1077 33
   8       0 sda 12 0 104 0 20 0 200 0 0 0 0
   8      32 sdb 5000 0 5000 0 5000 0 5000 0 0 0 0
)";

inline constexpr std::string_view kNetDevBefore =
    R"(Inter-|   Receive                                                |  Transmit
 face |bytes    packets errs drop fifo frame compressed multicast|bytes    packets errs drop fifo colls carrier compressed
    lo: 10476236   28813    0    0    0     0          0         0 10476236   28813    0    0    0     0       0          0
  eth0:4294967000     621    1    0    0     0          0         0    33269     401    2    0    0     0       0          0
 wlan0: 500 5 0 0 0 0 0 0 600 6 0 0 0 0 0 0
)";
inline constexpr std::string_view kNetDevAfter =
    R"(Inter-|   Receive                                                |  Transmit
 face |bytes    packets errs drop fifo frame compressed multicast|bytes    packets errs drop fifo colls carrier compressed
    lo: 10477236   28823    0    0    0     0          0         0 10477236   28823    0    0    0     0       0          0
  eth0:     704     631    4    0    0     0          0         0    34269     411    7    0    0     0       0          0
 wlan0: 700 7 0 0 0 0 0 0 900 9 0 0 0 0 0 0
 wlan1: 99999 9 9 0 0 0 0 0 99999 9 9 0 0 0 0 0
)";

inline constexpr std::string_view kLoadavg = "2.62 1.28 0.56 5/109 17888\n";
inline constexpr std::string_view kUptime = "2755.42 4965.15\n";

}  // namespace tallyd::tallyctl
