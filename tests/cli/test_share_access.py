"""Who may use a share: /etc/remvol/shares.conf becomes a list of users in the generated sections."""

import os

import pytest

from test_shares import AFP_SHARES, HEAD, SHARES, cutting_off, netatalk, section, shares  # noqa: F401

ACCESS = "/etc/remvol/shares.conf"
WRONG = "; the shares stay as they are\n"


def users(text):
    return f"\tvalid users = {text}\n"


def allow(shares, text):  # noqa: F811
    shares.box.write(ACCESS, text)


def test_a_list_of_users_and_groups(shares):  # noqa: F811
    shares.add("Photos")
    shares.add("Open")
    allow(shares, "# who\n\n[Photos]\n\tusers = maria , @family,DOM\\otto\r\n; end\n")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("Photos", options=users("maria,@family,DOM\\otto")) + section("Open")


def test_a_file_without_a_rule_changes_nothing(shares):  # noqa: F811
    shares.add("Photos")
    shares.reload()
    before = shares.box.path(SHARES).stat().st_ino
    for text in ("", "# [Photos]\n#users = maria\n"):
        allow(shares, text)
        assert shares.reload() == ""
        assert shares.box.path(SHARES).stat().st_ino == before


@pytest.mark.parametrize("name", ["photos", "PHOTOS", " Photos "])
def test_a_share_is_named_as_servers_compare_names(shares, name):  # noqa: F811
    shares.add("Photos")
    allow(shares, f"[{name}]\nusers = maria\n")
    assert shares.reload() == ""
    assert shares.file() == HEAD + section("Photos", options=users("maria"))


def test_names_with_blanks_are_in_quotes(shares):  # noqa: F811
    shares.add("Two words")
    allow(shares, "[Two words]\nusers = otto, @DOM\\domain users, Jörg Ä\n")
    shares.reload()
    assert shares.file() == HEAD + section("Two words", options=users('otto,"@DOM\\domain users","Jörg Ä"'))


LIST = "this is neither [SHARE] nor users = NAME, ..."
CHARACTER = "a name holds a character that the file servers do not take"
UNSEEN = "a name holds a character that is not seen"
NOT_UNDERSTOOD = [
    ("[Photos\nusers = maria\n", 1, "a heading has no ] at its end"),
    ("[]\nusers = maria\n", 1, "a heading names no share"),
    ("[\udcff]\nusers = maria\n", 1, "a heading names no share"),
    ("users = maria\n", 1, "no [SHARE] stands above it"),
    ("[Photos]\nuser = maria\n", 2, LIST),
    ("[Photos]\nusers maria\n", 2, LIST),
    ("[Photos]\nvalid users = maria\n", 2, LIST),
    ("[Photos]\n", 1, "it has no list"),
    ("[Photos]\n[Open]\nusers = maria\n", 1, "it has no list"),
    ("[Photos]\nusers = maria\nusers = otto\n", 3, "this share has a list already"),
    ("[Photos]\nusers = maria\n[PHOTOS]\nusers = otto\n", 3, "this share has been named above"),
    ("[Photos]\nusers =\n", 2, "a name is empty"),
    ("[Photos]\nusers = maria,\n", 2, "a name is empty"),
    ("[Photos]\nusers = @\n", 2, "a name is empty"),
    ("[Photos]\nusers = " + "maria," * 200 + "otto\n", 2, "the list is too long"),
    *((f"[Photos]\nusers = {name}\n", 2, CHARACTER) for name in (
        "%U", "ma%Sria", '"', 'maria"', "'maria'", "maria#x", "maria;x", "a=b", "+maria", "&maria", "@@x", "@+x", "-x",
        "*", "[Open]", "a/b", "a:b", "maria\\")),
    ("[Photos]\nusers = mar\x00ia\n", 2, UNSEEN), ("[Photos]\nusers = mar\tia\n", 2, UNSEEN),
    ("[Photos]\nusers = mar\u202eia\n", 2, UNSEEN), ("[Photos]\nusers = mar\u200bia\n", 2, UNSEEN),
    ("[Photos]\nusers = ma\u2028ria\n", 2, UNSEEN), ("[Photos]\nusers = \udcff\n", 2, "a name is not UTF-8"),
]


@pytest.mark.parametrize("text, line, why", NOT_UNDERSTOOD)
def test_a_file_that_is_not_understood_opens_nothing(shares, text, line, why):  # noqa: F811
    """Whom it was to shut out is not known: what is shared stays so, and nothing new comes."""
    shares.add("Photos")
    allow(shares, "[Photos]\nusers = maria\n")
    shares.reload()
    before = shares.file()
    shares.add("New")
    allow(shares, text.encode("utf-8", "surrogateescape"))
    assert shares.reload() == f"winshare_reload: {ACCESS}, line {line}: {why}{WRONG}"
    assert shares.file() == before
    shares.umount("Photos")
    shares.reload()
    assert shares.file() == HEAD


def test_before_anything_is_shared_a_wrong_file_keeps_it_so(shares):  # noqa: F811
    shares.add("Photos")
    allow(shares, "[Photos]\n")
    shares.reload()
    assert not shares.box.path(SHARES).exists()


@pytest.mark.parametrize("make", [lambda path: path.mkdir(), lambda path: os.mkfifo(path),
                                  lambda path: path.write_text("#" + "x" * (2 << 20)),
                                  lambda path: path.symlink_to(ACCESS),
                                  lambda path: path.symlink_to("/nowhere")])
def test_a_file_that_cannot_be_read_opens_nothing(shares, make):  # noqa: F811
    shares.add("Photos")
    shares.sh("mkdir -p /etc/remvol")
    make(shares.box.path(ACCESS))
    assert shares.reload() == f"winshare_reload: {ACCESS}: it cannot be read{WRONG}"
    assert not shares.box.path(SHARES).exists()


def test_shares_are_withdrawn_whatever_the_file_says(shares):  # noqa: F811
    shares.add("Photos")
    shares.reload()
    allow(shares, "nonsense\n")
    assert shares.reload("winshare_reload", "--withdraw") == ""
    assert shares.file() == HEAD


def test_a_rule_for_no_share_is_said(shares):  # noqa: F811
    shares.add("Photos")
    shares.add("Away", mounted=False)
    allow(shares, "[Phots]\nusers = maria\n[away]\nusers = maria\n")
    assert shares.reload() == f'winshare_reload: {ACCESS}: no volume has the share name "Phots"\n'


def test_who_may_not_be_in_a_share_any_more_is_put_out(shares):  # noqa: F811
    for name in ("Photos", "Stays", "Other"):
        shares.add(name)
    allow(shares, "[Photos]\nusers = maria, otto\n[Stays]\nusers = maria\n")
    shares.reload()
    shares.told()
    allow(shares, "[Photos]\nusers = maria\n[Stays]\nusers = maria\n[Other]\nusers = maria\n")
    shares.reload()
    assert shares.told() == cutting_off("Photos", "Other")
    allow(shares, "[Photos]\nusers = maria\n[Stays]\nusers = maria\n")
    shares.reload()
    assert shares.told() == cutting_off("Other")
    assert shares.reload() == "" and shares.told() == []


# --- netatalk ---


def test_netatalk_gets_the_list_as_well(netatalk):  # noqa: F811
    netatalk.add("Photos")
    allow(netatalk, "[Photos]\nusers = maria, @family\n")
    assert netatalk.reload("macshare_reload") == ""
    assert netatalk.file(AFP_SHARES).endswith(section("Photos", options=users("maria,@family")))


def test_netatalk_would_take_a_name_with_a_blank_for_two(netatalk):  # noqa: F811
    netatalk.add("Photos")
    netatalk.add("Open")
    allow(netatalk, "[Photos]\nusers = otto, domain users\n")
    assert netatalk.reload("macshare_reload") == (
        'macshare_reload: volume "Photos" is not shared: the file server takes no blanks in the names of its users\n')
    assert "[Photos]" not in netatalk.file(AFP_SHARES) and "[Open]" in netatalk.file(AFP_SHARES)
