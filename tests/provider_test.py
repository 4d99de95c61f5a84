"""provider, also called list-providers."""

from records import make
from runs import Case

LIST = "nexus_provider_list"
ID, INSTANCE = "FEDCBA98-7654-3210-0123-456789ABCDEF", "01000000-0000-0000-0000-00000000000A"
RINGS = "\trings: tx -2147483648 rx -2 slots: tx -3 rx -4 bufsize -5 metasize -6 mhints -7\n"
FULL = "n" * 64
ROWS = (("user-pipe z ID", dict(name="z")), ("kernel-pipe p ID [anon]", dict(type=1, subtype=1, flags=1)),
        ("net-if p ID [anon]", dict(type=2, flags=-1)), ("flow-switch (bridge) p ID", dict(type=3, flags=-2)),
        (f"flow-switch (multistack) p ID\n\tinstance {INSTANCE}\n\tinstance ID",
         dict(type=3, subtype=1, instances=[INSTANCE, ID])), ("unknown p ID", dict(type=4)),
        ("flow-switch (unknown type)) p ID", dict(type=3, subtype=2)), ("unknown p ID", dict(type=-1, subtype=1)),
        ("flow-switch (unknown type)) p ID", dict(type=3, subtype=-1)), ("user-pipe  ID", dict(name_length=0)),
        *((f"user-pipe {shown} ID", dict(name=name, name_length=length)) for name, length, shown in (
            ("utun", 2, "ut"), ("utun", 64, "utun"), ("ut\0un", 5, "ut"), (FULL, 63, FULL[:63]), (FULL, 64, FULL),
            (FULL, 65, FULL), (FULL, (1 << 31) - 1, FULL), (FULL, 1 << 31, FULL), (FULL, -1, FULL))))


def provider(name="p", name_length=1, instances=(), **values):
    rings = dict(tx_rings=1 << 31, rx_rings=-2, tx_slots=-3, rx_slots=-4, buf_size=-5, meta_size=-6, mhints=-7)
    return make("nexus_provider_record", provider_uuid=ID, name=name, name_length=name_length, pipes=8, format=9,
                instances=[make("uuid", uuid=each) for each in instances], **rings, **values)


class Provider(Case):
    def test_ListsInTheOrderOfTheTable(self):
        table = {LIST: b"".join(provider(**values) for _, values in ROWS)}
        listing = [f"{row}\n".replace("ID", ID) for row, _ in ROWS]
        self.expect(table, ("provider", "provider -- -D"), "".join(listing))
        detailed = "provider -D", "provider -DD", "provider --d", "provider x -D", "LIST-PROVIDERS --details"
        self.expect(table, detailed, "".join(row.replace("\n", "\n" + RINGS, 1) for row in listing))
