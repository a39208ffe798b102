"""Every block of the documents is run by a test: by one of these, by a scenario that takes the block out of the document
(block, run_block and run_dialogue of tests/lab/70-documents.sh), or by the test or script that is named for it."""

import re

import pytest

from harness.documents import PAGES, TOP, blocks_of
from test_share_access import allow, shares  # noqa: F401
from test_shares import HEAD, SHARES
from test_vvstat import T1_NAME, change, example, session  # noqa: F401

DOCUMENTS = [*(TOP / name for name in ("README.md", "CONTRIBUTING.md", "SECURITY.md", "CHANGELOG.md")),
             *sorted((TOP / "docs").glob("*.md")), *PAGES]


BLOCKS = [(str(path.relative_to(TOP)), block) for path in DOCUMENTS for block in blocks_of(path)]


def block(document, start):
    found, = [text for name, text in BLOCKS if name == document and text.startswith(start)]
    return found


def taken_by_scenarios():
    """(document, start) of the blocks that scenarios take out of documents."""
    text = (TOP / "tests/lab/70-documents.sh").read_text()
    return {(document, start.replace('\\"', '"')) for document, start in
            re.findall(r'^(?:run_)?(?:block|dialogue) (\S+) "((?:[^"\\]|\\.)*)"', text, re.M)}


# What gives a person a terminal, and no test runs.
BY_HAND = ("lab/run", "--shell")

# Blocks whose lines run elsewhere: for each line that a person types, the file that has what runs it, and the words.
# A line that is not among them must stand in the file that is named for the block, as it is.
STAGE, NEWS, RUNNER = "tests/machine/stages/installed.sh", "tests/machine/70-notify.sh", "scripts/test"
ELSEWHERE = [
    ("README.md", "apt-get install", {"apt-get install ./build/package/": (STAGE, "install_packages")}),
    ("README.md", "scripts/demo", {"scripts/demo": ("scripts/record-demo", '"scripts/demo"'),
                                   "scripts/test": (".ci/run", "scripts/test")}),
    ("README.md", "scripts/install-packages build", {
        "scripts/install-packages": ("scripts/demo", "scripts/install-packages build lab"),
        "cmake -S . -B": ("scripts/demo", "cmake -S . -B $build -DCMAKE_BUILD_TYPE=Release"),
        "cmake --build": ("tests/cli/test_documents.py", '"cmake", "--install", BUILD')}),
    ("CONTRIBUTING.md", "scripts/demo", {"scripts/demo": ("scripts/record-demo", '"scripts/demo"'),
                                         "scripts/test LAYER": (RUNNER, "scripts/test [LAYER...]"),
                                         "scripts/test format": (RUNNER, "layer_format()")}),
    ("docs/lab.md", "scripts/install-packages build test lab", {
        "scripts/install-packages": (RUNNER, "install_groups build test"),
        "cmake --preset": (RUNNER, "cmake --preset $1 && cmake --build build/$1"),
        "scripts/package": (RUNNER, "scripts/package"), "lab/run smoke": ("tests/lab/check-runner", "lab/run"),
        "lab/run -j5 --all": (RUNNER, "lab/run -j$((2 * jobs + 1)) --all"),
        "lab/run --output": ("lab/record-samples", "lab/run --output"),
        "lab/shell": BY_HAND}),
    ("docs/lab.md", "scripts/install-packages lab a", {
        "scripts/install-packages": (RUNNER, "install_groups lab armlab"),
        "scripts/package --arch": (RUNNER, 'scripts/package --arch "$arch"'),
        "LAB_ARCH=arm64": (RUNNER, "LAB_ARCH=arm64 lab/run lab/demo.sh")}),
    ("docs/lab.md", "scripts/package", {
        "scripts/package": (RUNNER, "scripts/package"), "scripts/test machine": (RUNNER, "layer_machine()"),
        "lab/machine/run bookworm restart": (RUNNER, "lab/machine/run"),
        "lab/machine/run bookworm --shell": BY_HAND}),
    ("docs/lab.md", "scripts/test arm", {
        "scripts/test arm": (RUNNER, "layer_arm()"), "scripts/package --arch": (RUNNER, 'scripts/package --arch "$arch"'),
        "scripts/fresh-root": (RUNNER, 'scripts/cross "$arch" scripts/test unit')}),
    ("docs/monitoring.md", "systemctl enable", NEWS),
    ("docs/operators-guide.md", "scripts/package", {"scripts/package": (RUNNER, "scripts/package"),
                                                    "apt-get install": (STAGE, "install_packages")}),
    ("docs/operators-guide.md", "systemctl status", {
        "systemctl status 'remvol*'": (NEWS, "systemctl status 'remvol*'"),
        "journalctl -u 'remvol*'": (NEWS, "journalctl --no-pager -u 'remvol*'"),
        "journalctl -t winshare_reload": (NEWS, "journalctl --no-pager -t winshare_reload")}),
    ("docs/operators-guide.md", "update-initramfs -u", NEWS),
    ("docs/operators-guide.md", "adduser", {
        "adduser --no-create-home --disabled-login maria": (NEWS, "adduser --no-create-home --disabled-login maria"),
        "smbpasswd -a maria": (NEWS, "smbpasswd -s -a maria")}),
    ("docs/operators-guide.md", "journalctl -x", {
        "journalctl -x": (NEWS, "journalctl --no-pager -x SYSLOG_IDENTIFIER=remvol-notify")}),
    ("docs/man/remvol-events.8", "remvol-events --test", {
        "remvol-events --test": (NEWS, "remvol-events --test"),
        "journalctl -b -u remvol-events": (NEWS, "journalctl --no-pager -b -u remvol-events")}),
    ("docs/man/remvol-keeper.8", "journalctl -b", {
        "journalctl -b -u remvol-keeper": (NEWS, "journalctl --no-pager -b -u remvol-keeper"),
        "remvol-keeper &": ("tests/lab/70-documents.sh", "remvol-keeper &")}),
    ("docs/man/remvol-notify.8", "journalctl -x", {
        "journalctl -x": (NEWS, "journalctl --no-pager -x SYSLOG_IDENTIFIER=remvol-notify SHARE=Photos"),
        "remvol-notify": ("tests/cli/test_notify.py", '"remvol-notify"')}),
    ("docs/man/vv.xml.5", "cp -p", NEWS),
]

# Blocks that test_documents.py reads, by the words of the test.
READ = [
    ("README.md", "Summary", "test_the_summary_of_the_readme_is_the_recording_s"),
    ("docs/monitoring.md", "#!/bin/sh", "test_the_check_of_the_monitoring_guide"),
    ("docs/settings-file.md", "<?xml", "test_the_settings_file_of_the_example_is_what_the_tree_writes"),
    ("docs/tree-layout.md", "# ktreec -S /var/run/ktree_sock_vv -t", "test_the_tree_of_the_example_can_be_set_up"),
    ("docs/wire-protocol.md", "-> ", "test_the_bytes_of_the_example_are_what_goes_over_the_wire"),
    ("docs/man/libktreec.3", "#include", "test_the_program_of_the_library_s_manual_page"),
    ("docs/man/libktreec.3", "cc ", "test_the_program_of_the_library_s_manual_page"),
    ("docs/man/vv.xml.5", "<?xml", "test_the_settings_of_the_manual_page_are_read"),
]

# Blocks that tests below run, and a drawing.
HERE = [
    ("docs/architecture.md", "  administration pages"),
    ("docs/architecture.md", "   frontend/    main"),
    ("docs/monitoring.md", "groups:"),
    ("docs/operators-guide.md", "# /etc/systemd/network/10-egiga0.link"),
    ("docs/operators-guide.md", "MAILADDR"),
    ("docs/man/ktree.8", "ktree -n config"),
    ("docs/man/remvol.conf.5", "MAILADDR"),
    ("docs/man/remvol.conf.5", "#!/bin/sh"),
    ("docs/man/remvol-shares.conf.5", "[Photos]"),
    ("docs/man/vvstat.1", "vvstat -x"),
]

KNOWN = [*taken_by_scenarios(), *((document, start) for document, start, _ in ELSEWHERE),
         *((document, start) for document, start, _ in READ), *HERE]


@pytest.mark.parametrize("document, text", BLOCKS, ids=[f"{name}-{text.splitlines()[0][:30]}" for name, text in BLOCKS])
def test_every_block_is_run(document, text):
    assert [start for name, start in KNOWN if name == document and text.startswith(start)], f"nobody runs:\n{text}"


@pytest.mark.parametrize("document, start", sorted(set(KNOWN)))
def test_what_is_said_to_be_run_is_there(document, start):
    assert len([text for name, text in BLOCKS if name == document and text.startswith(start)]) == 1


@pytest.mark.parametrize("document, start, where", ELSEWHERE)
def test_a_line_that_runs_elsewhere_is_there(document, start, where):
    for line in filter(None, block(document, start).splitlines()):
        if isinstance(where, str):
            file, words = where, line
        else:
            file, words = next(place for beginning, place in where.items() if line.startswith(beginning))
        assert words in (TOP / file).read_text(), f"{file} does not run: {line}"


@pytest.mark.parametrize("document, start, test", READ)
def test_a_test_that_reads_a_block_is_there(document, start, test):
    assert f"\ndef {test}(" in (TOP / "tests/cli/test_documents.py").read_text()


# --- the blocks of HERE ---


def run(box, text, shell="sh"):  # what cron and a script have
    done = box.run([shell, "-c", text], env={"LD_PRELOAD": None})
    return done.status, done.stdout, done.stderr


def test_the_examples_of_vvstat(example):  # noqa: F811
    example.fake("mail")
    commands = block("docs/man/vvstat.1", "vvstat -x").splitlines()
    assert run(example, commands[0])[0] == 0 and example.runs("mail") == []
    change(example, {"lun/id:1/format_state": "3"})
    example.run(["/bin/umount", "/mnt/VV/Backup"], env={"LD_PRELOAD": None})
    assert run(example, commands[0])[0] == 0
    call, = example.runs("mail")
    assert call[0] == "-s" and call[1].startswith("volumes of ") and call[2:] == ["root"]
    assert run(example, commands[1]) == (0, "Backup: its format failed\n", "")
    for command in commands[2:]:
        status, _, errors = run(example, command.replace("Photos", "'Fotos 日本'"))
        assert (status, errors) == (1 if "Photos" not in command else 0, ""), command


def test_the_example_of_a_tree_of_one_s_own(box):
    box.tree.set("/a", "b")
    text = block("docs/man/ktree.8", "ktree -n config").replace("\nktreec", "\nsleep 0.5\nktreec")
    box.write("/etc/NAS_CFG/vv.xml", "<config><one>two</one></config>", mode=0o600)
    status, printed, errors = run(box, "set -m\n" + text, "bash")
    assert (status, printed, errors) == (0, "/one=two\n", "")


def test_the_examples_of_who_is_told(example):  # noqa: F811
    for text in (block("docs/operators-guide.md", "MAILADDR"), block("docs/man/remvol.conf.5", "MAILADDR")):
        example.write("/usr/sbin/sendmail", "#!/bin/sh\ncat >/mail\n", mode=0o755)
        example.write("/usr/local/sbin/volume-news", "#!/bin/sh\necho $1 >/news\n", mode=0o755)
        example.write("/etc/remvol/remvol.conf", text)
        done = example.run(["remvol-notify", "--test"], env={"LD_PRELOAD": None})
        assert done.status == 0 and "no such word" not in done.stderr
        assert "To: admin@example.org\n" in example.path("/mail").read_text()
    assert example.path("/news").read_text() == "test\n"


def test_the_example_of_a_program_that_is_told(example):  # noqa: F811
    example.fake("wall")
    example.write("/etc/remvol/events.d/10-wall", block("docs/man/remvol.conf.5", "#!/bin/sh"), mode=0o755)
    example.run(["remvol-notify", "--test"], env={"LD_PRELOAD": None})
    assert example.runs("wall") == []
    session(example, 3, T1_NAME, "FAILED")
    example.run(["remvol-notify"], env={"LD_PRELOAD": None})
    assert [call[0].startswith("Volume ") for call in example.runs("wall")] == [True, True]


def test_the_example_of_a_list_of_users(shares):  # noqa: F811
    shares.add("Photos")
    allow(shares, block("docs/man/remvol-shares.conf.5", "[Photos]"))
    assert shares.reload() == ""
    assert shares.file().startswith(HEAD) and "\tvalid users = maria,@family\n" in shares.file(SHARES)


def test_the_rules_of_the_monitoring_guide_know_their_metrics(example):  # noqa: F811
    text = block("docs/monitoring.md", "groups:")
    assert text.count("- alert:") == text.count("expr:") == text.count("summary:") == 3
    metrics = example.run(["vvstat", "-P"], env={"LD_PRELOAD": None}).stdout
    asked = set(re.findall(r"remvol_\w+(?=[ <>=])", text))
    assert len(asked) == 4
    for name in asked:
        assert f"# TYPE {name} gauge\n" in metrics


def test_the_link_file_of_the_guide_names_a_port():
    lines = block("docs/operators-guide.md", "# /etc/systemd/network").splitlines()
    assert lines[0] == "# /etc/systemd/network/10-egiga0.link"
    for line in filter(None, lines[1:]):
        assert line in (TOP / NEWS).read_text(), line


# --- commands in the text ---

COMMANDS = sorted({(str(path.relative_to(TOP)), code) for path in DOCUMENTS if path.suffix == ".md"
                   for code in re.findall(r"`((?:remvol|vvstat|vv|ktreec?|scripts/\w+|lab/\w+|systemctl) [^`]+)`",
                                          re.sub(r"^```.*?^```$", "", path.read_text(), flags=re.M | re.S))})


def words_of_page(program):
    text = next(path for path in PAGES if path.name.rsplit(".", 1)[0] == program).read_text()
    return re.sub(r"\\f[BRI]|\"", "", text).replace("\\-", "-")


@pytest.mark.parametrize("document, command", COMMANDS)
def test_a_command_in_the_text_has_options_that_exist(document, command):
    program, *words = re.split(r"[;&|>]", command.replace("\\|", "|"))[0].split()
    if program == "systemctl":
        units = {path.name for path in (TOP / "packaging/units").iterdir()}
        assert all(f"{word}.service" in units or word in units for word in words if word.startswith("remvol")), command
    elif "/" in program:
        assert (TOP / program).exists()
        layers = set(re.findall(r"layer_(\w+)\(\)", (TOP / RUNNER).read_text()))
        if program == "scripts/test":
            assert all(word.split(":")[0] in layers for word in words if word.islower()), command
    else:
        options = [word.rstrip(",.") for word in words if word.startswith("-")]
        for option in options:
            assert re.search(rf"(?<![\w-]){re.escape(option)}(?![\w-])", words_of_page(program)), command
