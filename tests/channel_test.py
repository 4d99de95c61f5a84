"""channel: the listing, the ring table, the watch loop of its own."""

from records import make
from runs import MISSING, Case, Result

LIST, SWITCH, ON = "nexus_channel_list", "ring_stat_enable", b"\x80"
A, B = "AAAAAAAA-0000-0000-0000-00000000000A", "BBBBBBBB-0000-0000-0000-00000000000B"
P, Q, R = b"0123456789abcdef", b"0123456789abcdeX", b"X123456789abcdef"
PARTS = "slots bytes count min_slots max_slots slots_per_sec slots_per_sec_avg bytes_per_sec bytes_per_sec_avg".split()
ONCE = ("Ring            Bytes/s  average        Bytes  Slots/s  average        Slots  Min  Avg  Max\n"
        " Mem Use/Total    /sync                 Bytes    /sync                 Slots               \n")
WATCH = ("Ring            Bytes/s  average    delta  Slots/s  average    delta  Min  Avg  Max   Xfer/s\n"
         " Mem Use/Total    /sync                      /sync                                    Sync/s\n")
IDLE = "           0/0     0.00     0.00     0.00     0.00     0.00     0.00    0    0    0     0.00\n"


def group(nexus, *channels, **values):
    return make("nexus_channel_header", nexus_uuid=nexus, channels=list(channels), **values)


def channel(uuid, port, **values):
    return make("channel_entry", channel_uuid=uuid, port=port, **{"pid": 77, "fd": 5, **values})


def ring(number, xfer=(), sync=(), **values):
    return make("ring_stats", ring_id=number, xfer=dict(zip(PARTS, xfer)), sync=dict(zip(PARTS, sync)), **values)


def port(number):
    return f"\tPort[{number:2}] <unknown>.77           (fd 5)\t\n"


def change(title, moved="0.00", slots="0.00", average=0, rate="0.00", sync=IDLE):
    """The lines of a ring in a watch, with 0 for all else."""
    zeros = "    0.00     0.00"
    return f"{title:14} {zeros} {moved:>8} {zeros} {slots:>8}    0 {average:4}    0 {rate:>8}\n{sync}"


class Channel(Case):
    def test_ListsNexusesChannelsAndRings(self):
        self.kernel.process(4194304, "fifteen-letters")
        tx = ring(0, (23, -1, 4, 1, -1, 999, -1, 999999, 1500000),
                  (7, 12, 0, 1 << 31, 9999, 1, 2000, 1000, 10**9), mem_total=3 << 20, mem_used=1536, err_corrupted=3)
        rx = ring(1 << 31, (-1, 0, 1, 0, 0, 0, 0, 10**15, -1), (1999, 1, 1000, 0, 0, 0, 0, 10**12), mem_total=-1,
                  mem_used=1234567, err_corrupted=10**6, err_len_modified=1, err_len_too_large=1500)
        table = group(B) + group(A, channel(P, 2, fd=-1), channel(Q, -1, flags=0x8000007F, tx=[tx], rx=[rx]),
                                 channel(P, 12, pid=4194304, rx=[ring(1, mem_used=1023, mem_total=1024)]))
        self.expect({LIST: table, SWITCH: ON}, "channel", f"""\
Instances: 2
1. {B}
2. {A}
\tPort[ 2] <unknown>.77           (fd -1)\t

\tPort[4294967295] <unknown>.77           (fd 5)\t flags=8000007f\
<MON_TX,MON_RX,NO_COPY,USER_PACKET_POOL,DEFUNCT_OK,EXCLUSIVE,DEFUNCT>
{ONCE}\
TX[0]          1000.00K    1.50M 18446744073709551615   999.00    4.29G           23    1    5   -1
     1.5KB/3MB    1.00K    1.00G           12     1.00    2.00K            7 -2147483648    0 9999
     Errors: Corrupted data: 3.00
RX[-2147483648] 1000.00T 18446744.07T            0     0.00     0.00 18446744073709551615    0 18446744073709551615    0
1.17737MB/1.67772e+07TB    1.00T     0.00            1     0.00     0.00         1999    0    1    0
     Errors: Length modified: 1.00 Length too large: 1.50K Corrupted data: 1.00M

\tPort[12] fifteen-letters.4194304 (fd 5)\t
RX[1]              0.00     0.00            0     0.00     0.00            0    0    0    0
      1023/1KB     0.00     0.00            0     0.00     0.00            0    0    0    0


""")

    def test_SwitchDecidesAboutRings(self):
        ports = 9, 1, 8, 2, 5
        table = 3 * group(A, *(channel(P, number, tx=[ring(0)]) for number in ports))
        listing = "Instances: 3\n" + "".join(f"{i}. {A}\n" + "".join(map(port, ports)) for i in (1, 2, 3)) + "\n"
        self.expect({LIST: table, SWITCH: b"\0"}, "channel", listing)
        self.expect({SWITCH: None}, "channel", listing, 15 * "failed to get channel stat, No such file or directory\n")

    def test_WatchShowsWhatHappenedBetweenTwoSnapshots(self):
        p = channel(P, 2, tx=[ring(3, (10, 1000, 100), (1, 5, 2), err_len_too_large=5), ring(3)], rx=[ring(3, (0, 70))])
        r = channel(R, 3, tx=[ring(90, (0, 60)), ring(90), *(ring(2 * i, (0, i)) for i in range(18, 0, -1))])
        later = group(B, channel(Q, 7, tx=[ring(3, (9, 9, 2), (9, 9, 9))])) + group(
            A, channel(P, 2, tx=[ring(3, (400, 2500, 105), (1, 3, 5), err_len_too_large=7), ring(4, (8, 9, 2))],
                       rx=[ring(3, (0, 75))]),
            channel(R, 3, tx=[ring(90, (0, 67)), ring(7, (0, 9)), ring(4, (0, 11)), ring(91, (0, 9))]))
        before = {SWITCH: ON, LIST: group(A, p, r, channel(P, 3, tx=[ring(3)]))}
        seen = self.watch("channel -w 2", before, {}, {LIST: later})
        self.assertEqual((seen.out.count("Instances: "), *seen[1:]), (2, "sleep 2\n" * 3, 0))
        first = change("TX[3]", average=4, sync=change("           0/0", average=1, sync=""))
        second = change("TX[3]", "1.50K", "390.00", 3, "2.00", sync=change(
            "           0/0", "18446744.07T", rate="1.00", sync="     Errors: Length too large: 7.00\n"))
        self.assertEqual(seen.out.split("Instances: ")[-1], "".join((
            f"2\n1. {B}\n", port(7), WATCH, first, f"\n2. {A}\n", port(2), second, change("TX[4]", average=4),
            change("RX[3]", "5.00"), "\n", port(3), change("TX[90]", "7.00"), change("TX[7]"), change("TX[4]", "9.00"),
            change("TX[91]"), "\n\n")))

    def test_WatchStartsAnewAfterTheTableWasAway(self):
        first, second = ({LIST: group(A, channel(P, 2, tx=[ring(0, (0, moved))])), SWITCH: ON} for moved in (0, 50))
        listing, sleep = f"Instances: 1\n1. {A}\n{port(2)}{WATCH}{change('TX[0]')}\n\n", "sleep 1\n"
        seen = self.watch("channel -w 1", first, {}, {LIST: None}, {}, second, {}, {LIST: None})
        self.assertEqual(seen, Result(f"\n<time>\n{listing}No channels\n{listing}No channels\n",
                                      2 * sleep + 2 * (MISSING + sleep) + 2 * sleep + MISSING + sleep, 0))
