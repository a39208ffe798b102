"""The documents: their worked examples work, and they know every command, option and status text."""

import json
import os
import pathlib
import re
import subprocess
import xml.etree.ElementTree

import jsonschema
import pytest

from harness.documents import blocks_of, published_schema, strict_schema
from harness.initiator import store
from harness.ktree_daemon import BUILD, Daemon
from test_vvstat import TREE_PROBLEMS, UNMOUNTED_PROBLEMS, promtool

TOP = pathlib.Path(__file__).resolve().parents[2]
DOCS = TOP / "docs"


@pytest.fixture
def daemon():
    daemon = Daemon()
    yield daemon
    daemon.close()


def block(document, language=""):
    """The first block of a document."""
    return re.search(f"^```{language}\n(.*?)^```", document.read_text(), re.M | re.S).group(1)


def test_the_settings_file_of_the_example_is_what_the_tree_writes(daemon, tmp_path):
    example = block(DOCS / "settings-file.md", "xml")
    (tmp_path / "example.xml").write_text(example)
    assert daemon.run("-l", tmp_path / "example.xml").returncode == 0
    assert daemon.get("/iscsi/initiator/id:1/chap_pwd") == b"a<b"
    assert daemon.get("/iscsi/initiator/id:1/lun/id:1/share") == b"Photos \r"
    assert daemon.run("-D", tmp_path / "again.xml").returncode == 0
    assert (tmp_path / "again.xml").read_text() == example


def test_the_bytes_of_the_example_are_what_goes_over_the_wire(daemon):
    text = (DOCS / "wire-protocol.md").read_text()
    lines = re.findall(r"^(->|<-) ((?:[0-9a-f]{2} *)+)", text, re.M)
    assert [direction for direction, _ in lines] == ["->", "<-", "->", "<-"]
    with daemon.connect() as client:
        for direction, numbers in lines:
            message = bytes.fromhex(numbers)
            if direction == "->":
                client.sendall(message)
            else:
                assert client.recv(100) == message


def test_the_tree_of_the_example_can_be_set_up(daemon):
    lines = re.findall(r"^/\w\S*=.*$", (DOCS / "tree-layout.md").read_text(), re.M)
    assert len(lines) > 20
    for line in lines:
        path, _, value = line.partition("=")
        daemon.set(path, value)
    assert daemon.listing() == lines


def test_the_operators_guide_explains_every_status_text():
    texts = set(re.findall(r'"([A-Z][A-Za-z ]+)"', "".join(
        (TOP / "src/tree" / f"status_text.{end}").read_text() for end in ("h", "cpp"))))
    guide = (DOCS / "operators-guide.md").read_text()
    explained = re.findall(r"^\| ([^|]+?) \| [^|]+ \| [^|]*\|$", guide, re.M)
    assert {"Connected", "Running", "Offline"} <= texts
    for text in texts - {"Read Only"}:
        assert any(line.startswith(text) for line in explained), text
    assert "Running ( Read Only )" in explained


def plain(page):
    """The words of a manual page without its fonts and escapes."""
    text = (DOCS / "man" / page).read_text()
    return re.sub(r"\\f[BRI]|\"", "", text).replace("\\-", "-")


@pytest.mark.parametrize("page", sorted(path.name for path in (DOCS / "man").iterdir()))
def test_a_page_with_a_table_asks_for_what_draws_it(page):
    text = (DOCS / "man" / page).read_text()
    assert text.startswith("'\\\" t\n") == ("\n.TS\n" in text)


COMMANDS = re.findall(r'^    \{"(\w+)", ', (TOP / "src/frontend/commands.cpp").read_text(), re.M)


def test_the_manual_page_has_every_command_and_option_of_the_tool():
    page = plain("remvol.8")
    assert len(COMMANDS) == 19
    for word in ["--" + command for command in COMMANDS] + [f"-{letter}" for letter in "ipnsvcUPdlhow"]:
        assert re.search(rf"^\.[BI]\w* .*(?<![\w-]){word}(?![\w-])", page, re.M), word


@pytest.mark.parametrize("document", [*sorted(TOP.glob("*.md")), *sorted(DOCS.glob("*.md"))], ids=lambda path: path.name)
def test_a_file_of_the_sources_that_a_document_names_is_there(document):
    text = re.sub(r"^```.*?^```", "", document.read_text(), flags=re.M | re.S)
    for name in re.findall(r"`((?:bench|debian|include|lab|packaging|platform|scripts|src|tests)/[\w./-]+)[` ]", text):
        assert [*TOP.glob(name), *TOP.glob(name + ".*")], name


# The form of what all commands print, and one that does not end by itself (test_vvstat.py).
NO_COMMANDS = ("vv --json", "vvstat --watch")


def inline_commands():
    """(document, command) of what a sentence or a table tells a person to type, for the programs of this project."""
    for path in (TOP / "README.md", TOP / "CONTRIBUTING.md", TOP / "SECURITY.md", *sorted(DOCS.glob("*.md"))):
        text = re.sub(r"^```.*?^```", "", path.read_text(), flags=re.M | re.S)
        for command in re.findall(r"`((?:vv|vvstat|remvol|remvol-events) [^`]+)`", text):
            yield path.name, command.replace("\\|", "|")


@pytest.mark.parametrize("document, command", [each for each in sorted(set(inline_commands())) if each[1].startswith("vv") and each[1] not in NO_COMMANDS])
def test_a_command_in_a_sentence_is_understood(box, document, command):
    """One that is no more than the name of a command says what it lacks; all others come to the tree that is not there."""
    box.tree.stop()
    box.write("/bin/alert", "#!/bin/sh\n", mode=0o755)
    words = command.split()
    done = box.run(["sh", "-c", command.replace("|| alert", "")], env={"LD_PRELOAD": None})
    lacks = words[0] == "vv" and len(words) == 2 and words[1] != "status"
    assert done.status == (2 if lacks else 0 if "--version" in words else 3), (document, done.stderr)
    assert not lacks or re.search(r" (takes one|needs) ", done.stderr), (document, done.stderr)


@pytest.mark.parametrize("document, command", [each for each in sorted(set(inline_commands())) if each[1].startswith("remvol ")])
def test_a_command_of_the_tool_in_a_sentence_is_one(document, command):
    words = command.split()[1:]
    for word in words:
        if word.startswith("--"):
            assert word[2:] in COMMANDS, document
        elif word.startswith("-"):
            assert re.fullmatch(r"-[ipnsvcUPdlhow]", word), document


@pytest.mark.parametrize("status", sorted({status for _, status, _, _ in [*TREE_PROBLEMS, *UNMOUNTED_PROBLEMS]}))
def test_a_status_that_vvstat_shows_is_in_the_guide(status):
    assert re.search(rf'(^\| |"){status}( \||")', (DOCS / "operators-guide.md").read_text(), re.M)


@pytest.mark.parametrize("program", ["vv", "vvstat", "ktree", "ktreec", "remvol-events", "remvol-keeper", "remvol-notify"])
def test_the_help_of_a_program_fits_a_screen(program):
    told = subprocess.run([BUILD / "bin" / program, "--help"], stdout=subprocess.PIPE, text=True, check=True).stdout
    assert [line for line in told.splitlines() if len(line) > 80] == []


@pytest.mark.parametrize("program, page", [("vv", "vv.8"), ("vvstat", "vvstat.1"), ("ktree", "ktree.8"), ("ktreec", "ktreec.1"),
                                           ("remvol-events", "remvol-events.8"), ("remvol-keeper", "remvol-keeper.8"),
                                           ("remvol-notify", "remvol-notify.8")])
def test_a_manual_page_has_every_option_of_its_program(program, page):
    help_text = subprocess.run([BUILD / "bin" / program, "--help"], stdout=subprocess.PIPE, text=True, check=True).stdout
    options = set(re.findall(r"(?<![\w-])(--?[A-Za-z][\w-]*)", help_text)) - set(re.findall(r"remvol (--\w+)", help_text))
    assert "--help" in options
    for option in options:
        assert re.search(rf"(?<![\w-]){option}(?![\w-])", plain(page)), option


def test_the_monitoring_guide_has_every_metric(box):
    store(box, "iqn.t1", conn_set=1, luns=[(None, 1, {"format_state": 1, "mnt": "/mnt/VV"})])
    box.path("/mnt/VV").mkdir(parents=True)
    assert box.run(["/bin/mount", "-t", "tmpfs", "volume", "/mnt/VV"], env={"LD_PRELOAD": None}).status == 0
    assert box.run(["remvol-notify"], env={"LD_PRELOAD": None}).status == 0
    told = set(re.findall(r"^# TYPE (\w+)", box.run(["vvstat", "-P"], env={"LD_PRELOAD": None}).stdout, re.M))
    guide = (DOCS / "monitoring.md").read_text()
    assert told == set(re.findall(r"remvol_\w+", guide))


# When each rule of the guide says something, and what: minutes and alerts.
ALERTS = r"""
rule_files: [rules.yml]
evaluation_interval: 1m
tests:
  - interval: 1m
    input_series:
      - {series: 'remvol_volume_healthy{share="Photos", instance="nas"}', values: "1 1 0x10 1x10"}
      - {series: 'remvol_volume_used_bytes{share="Photos", instance="nas"}', values: "10x10 96x30"}
      - {series: 'remvol_volume_size_bytes{share="Photos", instance="nas"}', values: "100x40"}
      - {series: 'remvol_tree_reachable{instance="nas"}', values: "1x5 0x10 1x20"}
    alert_rule_test:
      - {eval_time: 6m, alertname: VolumeNeedsAttention, exp_alerts: []}
      - eval_time: 8m
        alertname: VolumeNeedsAttention
        exp_alerts:
          - exp_labels: {share: Photos, instance: nas}
            exp_annotations: {summary: "Volume Photos on nas needs attention: vvstat -x"}
      - {eval_time: 14m, alertname: VolumeNeedsAttention, exp_alerts: []}
      - {eval_time: 20m, alertname: VolumeNearlyFull, exp_alerts: []}
      - eval_time: 30m
        alertname: VolumeNearlyFull
        exp_alerts:
          - exp_labels: {share: Photos, instance: nas}
            exp_annotations: {summary: "Volume Photos on nas is nearly full"}
      - {eval_time: 9m, alertname: VolumesUnknown, exp_alerts: []}
      - eval_time: 12m
        alertname: VolumesUnknown
        exp_alerts:
          - exp_labels: {instance: nas}
            exp_annotations: {summary: "Nobody knows how the volumes of nas are: systemctl status remvol-tree"}
      - {eval_time: 30m, alertname: VolumesUnknown, exp_alerts: []}
  - interval: 1m
    input_series:
      - {series: 'remvol_tree_reachable{instance="nas"}', values: "1x40"}
      - {series: 'node_textfile_mtime_seconds{file="/var/lib/prometheus/node-exporter/remvol.prom", instance="nas"}', values: "0x40"}
    alert_rule_test:
      - {eval_time: 9m, alertname: VolumesUnknown, exp_alerts: []}
      - eval_time: 12m
        alertname: VolumesUnknown
        exp_alerts:
          - exp_labels: {instance: nas, file: /var/lib/prometheus/node-exporter/remvol.prom}
            exp_annotations: {summary: "Nobody knows how the volumes of nas are: systemctl status remvol-tree"}
"""


def test_promtool_accepts_the_rules_of_the_monitoring_guide(tmp_path):
    """And they say what they are for, when it is so."""
    rules, = re.findall(r"^```yaml\n(.*?)^```", (DOCS / "monitoring.md").read_text(), re.M | re.S)
    (tmp_path / "rules.yml").write_text(rules)
    (tmp_path / "tests.yml").write_text(ALERTS)
    checked = promtool("check", "rules", tmp_path / "rules.yml")
    assert checked.returncode == 0 and "SUCCESS: 3 rules found" in checked.stdout, checked.stdout
    tested = promtool("test", "rules", tmp_path / "tests.yml")
    assert tested.returncode == 0, tested.stdout


@pytest.mark.parametrize("wanted, status, line", [
    ("0", 0, "VOLUMES OK - nothing is wanted, as of "), ("1", 2, "VOLUMES CRITICAL - 1 of 1 needs attention, as of "),
    (None, 3, "VOLUMES UNKNOWN - vvstat: the configuration tree cannot be reached; see systemctl status remvol-tree")])
def test_the_check_of_the_monitoring_guide(box, wanted, status, line):
    check = box.write("/check_remvol", block(DOCS / "monitoring.md", "sh"), mode=0o755)
    assert check
    if wanted is None:
        box.tree.stop()
    else:
        store(box, "iqn.t1", conn_set=wanted)
    done = box.run(["/check_remvol"], env={"LD_PRELOAD": None})
    assert (done.status, done.lines[0].startswith(line)) == (status, True), done.stdout


def recorded():
    """What the recording of the demonstration shows, without its colours."""
    header, *events = map(json.loads, (DOCS / "demo.cast").read_text().splitlines())
    assert header["version"] == 2 and header["width"] > 80 and header["height"] > 24
    times = [moment for moment, kind, _ in events]
    assert times[0] == 0 and times == sorted(times) and {kind for _, kind, _ in events} == {"o"}
    return re.sub(r"\x1b\[[0-9;]*m", "", "".join(text for _, _, text in events)).replace("\r\n", "\n")


def test_one_version_everywhere():
    """That of CMakeLists.txt."""
    version = re.search(r"^project\(remvol VERSION (\S+) ", (TOP / "CMakeLists.txt").read_text(), re.M)[1]
    assert re.search(r"^## (\S+), ", (TOP / "CHANGELOG.md").read_text(), re.M)[1] == version
    assert (TOP / "debian/changelog").read_text().startswith(f"remvol ({version}) ")
    for page in (DOCS / "man").iterdir():
        assert set(re.findall(r'"remvol (\d[^"]*)"', page.read_text())) <= {version}, page
    for program in ("vv", "vvstat", "ktree", "ktreec", "remvol-events", "remvol-keeper", "remvol-notify"):
        told = subprocess.run([BUILD / "bin" / program, "--version"], stdout=subprocess.PIPE, text=True, check=True).stdout
        assert told == f"{program} {version}\n"


def test_the_demonstration_was_recorded_within_its_promise():
    """From the end of the build to the last line: 90 seconds."""
    events = (DOCS / "demo.cast").read_text().splitlines()[1:]
    assert json.loads(events[-1])[0] < 90
    assert float(re.search(r"that ran ([\d.]+) s", recorded())[1]) < 90
    assert "scripts/fair-time 90 lab/run" in (TOP / "scripts/demo").read_text()


def fair_time(tmp_path, limit, command, *, others=None):
    """Runs it; `others`: seconds that the processors work meanwhile, as the command notes them."""
    stat = tmp_path / "stat"
    stat.write_text("cpu  100 0 100 5000 0 0 0 0 0 0\n")
    if others is not None:
        command = f'{command}; printf "cpu  {100 + others * 100} 0 100 9000 0 0 0 0 0 0\\n" >{stat}'
    return subprocess.run([TOP / "scripts/fair-time", str(limit), "sh", "-c", command], stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, text=True, env={**os.environ, "FAIR_TIME_STAT": str(stat)})


def test_a_demonstration_that_takes_too_long_by_its_own_fault_fails(tmp_path):
    done = fair_time(tmp_path, 1, "sleep 1.5")
    assert done.returncode == 1 and done.stdout.startswith("It took ")
    assert "that is more than the 1 s that are promised" in done.stdout
    assert fair_time(tmp_path, 1, "sleep 1.5", others=0).returncode == 1


def test_a_demonstration_on_a_busy_machine_does_not(tmp_path):
    done = fair_time(tmp_path, 1, "sleep 1.5", others=60)
    assert done.returncode == 0 and ", while the processors worked 60 s for others.\n" in done.stdout.replace("59", "60")


def test_a_demonstration_that_fails_does(tmp_path):
    assert fair_time(tmp_path, 60, "exit 3").returncode == 3
    done = fair_time(tmp_path, 60, "true")
    assert done.returncode == 0 and re.fullmatch(r"It took \d+\.\d s\.\n", done.stdout)


def test_the_recording_tells_the_whole_story():
    told = recorded()
    headlines = [line.removesuffix("$plain\"") for line in (TOP / "lab/demo.sh").read_text().splitlines()
                 if line.startswith("headline ")]
    for number, line in enumerate(headlines, 1):
        assert f"\n{number}. {line.removeprefix('headline ')[1:-1]}\n".replace("\\", "") in told, line
    for text in ("all 1 healthy", "1 of 1 needs attention", "Subject: lost on", "sea.jpg: OK", "\nlab: demo: ok"):
        assert text in told


def test_the_summary_of_the_readme_is_the_recording_s():
    summary, = re.findall(r"^```\n(Summary\n.*?)^```", (TOP / "README.md").read_text(), re.M | re.S)
    assert "\n" + summary in recorded()


def test_the_picture_is_the_recording_s_end():
    rows = ["".join(row.itertext()) for row in xml.etree.ElementTree.parse(DOCS / "demo.svg").getroot()
            if row.tag.endswith("}text")]
    lines = [line.strip() for line in recorded().splitlines() if line.strip()]
    assert len(rows) > 20 and [" ".join(row.split()) for row in rows] == [" ".join(line.split()) for line in lines[-len(rows):]]


# Of each schema what it describes, with a member that a later version may add, at any depth.
LATER = {
    "vv.schema.json": [{"targets": [{"target": "iqn.t1", "shares": None, "later": 1}]},
                       {"luns": [{"lun": 1, "size": 0, "fstype": None, "share": None}], "later": 1},
                       {"outcomes": [{"command": None, "share": None, "target": None, "outcome": "failed", "status": 2, "message": "",
                                      "step": None, "why": None, "advice": None, "details": None, "later": {}}], "luns": []}],
    "vvstat.schema.json": [{"volumes": [{"share": "Photos", "later": 1}]}, {"volumes": [], "later": 1}],
}


@pytest.mark.parametrize("schema, told", [(schema, told) for schema in LATER for told in LATER[schema]])
def test_a_schema_lets_pass_what_a_later_version_adds(schema, told):
    jsonschema.validate(told, published_schema(schema))
    with pytest.raises(jsonschema.ValidationError):
        jsonschema.validate(told, strict_schema(schema))


PAGES = sorted(path.name for path in (DOCS / "man").iterdir())


def examples(page):
    return blocks_of(DOCS / "man" / page)


@pytest.mark.parametrize("page", PAGES)
def test_a_manual_page_is_well_formed_and_has_examples(page):
    text = (DOCS / "man" / page).read_text()
    if text.startswith(".so "):
        assert text.split("/")[1].strip() in PAGES
        return
    told = subprocess.run(["groff", "-man", "-Tutf8", "-t", "-ww", "-rLL=80n"], input=text, stdout=subprocess.PIPE,
                          stderr=subprocess.PIPE, text=True, check=True)
    assert told.stderr == "" and told.stdout
    assert page[-1] == re.search(r"^\.TH \S+ (\d) ", text, re.M)[1]
    sections = re.findall(r"^\.SH \"?(.*?)\"?$", text, re.M)
    assert sections[:3] == ["NAME", "SYNOPSIS", "DESCRIPTION"] and sections[-2:] == ["EXAMPLES", "SEE ALSO"]
    assert examples(page)


@pytest.mark.unsanitized
def test_every_program_function_and_file_has_its_page(tmp_path):
    subprocess.run(["cmake", "--install", BUILD, "--prefix", tmp_path], check=True, stdout=subprocess.DEVNULL)
    programs = {path.name for path in (tmp_path / "bin").iterdir()}
    functions = set(re.findall(r"\b(ktreec_\w+)\(", (TOP / "platform/include/ktreec.h").read_text()))
    assert {"remvol", "vvstat"} <= programs and len(functions) == 5
    names = {page.rsplit(".", 1)[0] for page in PAGES}
    assert programs | functions | {"libktreec", "vv.xml", "remvol.conf", "remvol-shares.conf"} <= names


def test_the_settings_of_the_manual_page_are_read(daemon, tmp_path):
    (tmp_path / "vv.xml").write_text(examples("vv.xml.5")[0])
    assert daemon.run("-l", tmp_path / "vv.xml").returncode == 0
    assert daemon.get("/iscsi/initiator/id:1/lun/id:1/share") == b"Photos"
    assert daemon.run("-D", tmp_path / "again.xml").returncode == 0
    assert (tmp_path / "again.xml").read_text() == examples("vv.xml.5")[0]


PROGRAM = """
#include <stdio.h>
#include <ktreec.h>
#include <ostel_common.h>
#include <sysaux.h>
int main(void) {
  char text[] = "  word  ";
  printf("[%s]\\n", strtrim(text, " "));
  return ktreec_set("/nowhere", 0, "/a", "b") == -1 ? 0 : 1;
}
"""


def pkg_config(prefix):
    """Installs the build there; returns the flags for its libraries, and their folder."""
    subprocess.run(["cmake", "--install", BUILD, "--prefix", prefix], check=True, stdout=subprocess.DEVNULL)
    folder = next(prefix.rglob("remvol-platform.pc")).parent
    flags = subprocess.run(["pkg-config", "--define-prefix", "--cflags", "--libs", "remvol-platform"], check=True,
                           stdout=subprocess.PIPE, text=True, env={**os.environ, "PKG_CONFIG_PATH": str(folder)}).stdout
    return flags.split(), folder.parent


@pytest.mark.unsanitized
@pytest.mark.native
def test_a_program_is_built_with_what_pkg_config_says(tmp_path):
    flags, libraries = pkg_config(tmp_path / "usr")
    (tmp_path / "program.c").write_text(PROGRAM)
    subprocess.run(["cc", tmp_path / "program.c", "-o", tmp_path / "program", *flags], check=True)
    done = subprocess.run([tmp_path / "program"], stdout=subprocess.PIPE, text=True,
                          env={**os.environ, "LD_LIBRARY_PATH": str(libraries)})
    assert (done.returncode, done.stdout) == (0, "[word]\n")


@pytest.mark.unsanitized
@pytest.mark.native
def test_the_program_of_the_library_s_manual_page(daemon, tmp_path):
    program, command = examples("libktreec.3")
    flags, libraries = pkg_config(tmp_path / "usr")
    (tmp_path / "status.c").write_text(program.replace("/var/run/ktree_sock_vv", str(daemon.socket)))
    # The command is that of the page; what it calls looks into the folder of this test.
    (tmp_path / "pkg-config").write_text(f'#!/bin/sh\necho "{" ".join(flags)}"\n')
    (tmp_path / "pkg-config").chmod(0o755)
    subprocess.run(["sh", "-c", command], check=True, cwd=tmp_path,
                   env={**os.environ, "PATH": f"{tmp_path}:{os.environ['PATH']}"})

    def run():
        return subprocess.run([tmp_path / "status"], stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True,
                              env={**os.environ, "LD_LIBRARY_PATH": str(libraries)})

    assert (run().returncode, run().stderr) == (1, "there is no volume\n")
    daemon.set("/iscsi/initiator/id:1/lun/id:1/status", "Running")
    assert (run().returncode, run().stdout) == (0, "Running\n")
