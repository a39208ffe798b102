"""Trees of an appliance, as settings documents, and what iscsiadm says of such a one."""

KEYS = {"ip": "10.9.0.2", "port": "3260", "chap": "1", "chap_name": "user", "chap_pwd": "secret-of-16-byte", "conn_set": "1",
        "conn_state": "1", "status": "Connected"}
LUN_KEYS = {"enable": "1", "vol_access_right": "1", "format_state": "0", "format_progress": "100", "volume_state": "0",
            "status": "Running", "size": "1000000/100000000", "fs_type": "ext4"}


MOST_LUNS = 16  # of a target; what the disks are numbered by


def name_of(target):
    return f"iqn.2026-01.org.example:storage.disk{target}"


def disk_of(target, lun):
    """The kernel's name of a disk: sda to sdz, sdaa to sdzz, sdaaa ..."""
    number, letters = (target - 1) * MOST_LUNS + lun, ""
    while number > 0:
        number, letter = divmod(number - 1, 26)
        letters = chr(ord("a") + letter) + letters
    return "sd" + letters


def elements(values):
    return "".join(f"<{key}>{value}</{key}>" for key, value in values.items())


def lun(target, number):
    disk = disk_of(target, number)
    share = f"volume{target}-{number}"
    return "<id>" + elements({"lun": number, "share": share, **LUN_KEYS, "dev": disk, "mnt_dev": f"/dev/{disk}1",
                              "mnt": f"/mnt/VV/{share}"}) + "</id>"


def document(targets, luns):
    """The settings of so many targets with so many LUNs each."""
    ids = "".join("<id>" + elements({"target": name_of(n), **KEYS}) + f"<lun><count>{luns}</count>" +
                  "".join(lun(n, m) for m in range(1, luns + 1)) + "</lun></id>" for n in range(1, targets + 1))
    head = elements({"ver": 1, "count": targets, "total_lun_count": targets * luns})
    return f"<config><iscsi><initiator>{head}{ids}</initiator></iscsi></config>"


def sessions(targets):
    return "".join(f"tcp: [{n}] 10.9.0.2:3260,1 {name_of(n)} (non-flash)\n" for n in range(1, targets + 1))


def session_in_detail(number, name, disks):
    """What is listed of one session, with a LUN for each of the disks."""
    return (f"Target: {name} (non-flash)\n\tCurrent Portal: 10.9.0.2:3260,1\n"
            f"\t\tiSCSI Session State: LOGGED_IN\n\t\tHost Number: {number}\tState: running\n" +
            "".join(f"\t\tscsi{number} Channel 00 Id 0 Lun: {m}\n\t\t\tAttached scsi disk {disk}\t\tState: running\n"
                    for m, disk in enumerate(disks, 1)))


def sessions_in_detail(targets, luns):
    return "".join(session_in_detail(n, name_of(n), [disk_of(n, m) for m in range(1, luns + 1)]) for n in range(1, targets + 1))


def sessions_among_others(targets, luns, others):
    """The same, with the sessions of so many further targets of MOST_LUNS in front of each."""
    text = ""
    for n in range(1, targets + 1):
        text += "".join(session_in_detail(n, f"{name_of(n)}.other{k}", ["sdzzz"] * MOST_LUNS) for k in range(others))
        text += session_in_detail(n, name_of(n), [disk_of(n, m) for m in range(1, luns + 1)])
    return text


def wide(nodes, value="a value of thirty-two characters"):
    """A settings document of so many nodes, at most 4,000 of one name side by side, below /bulk/a:N/b:M."""
    full, rest = divmod(nodes, 4000)
    folders = [4000] * full + ([rest] if rest else [])
    return "<config><bulk>" + "".join("<a>" + f"<b>{value}</b>" * count + "</a>" for count in folders) + "</bulk></config>"
