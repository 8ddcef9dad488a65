"""Tests of the package qzacl on the real library: the cases that the other languages run, too, decisions against the
questions of the C interface, and what is Python's own: texts, exceptions, owners, handlers.

Run by CTest, or with QZ_LIBRARY_DIR set by python3 -m pytest in bindings/python."""
import gc
import os
import signal
import threading
import time
from concurrent.futures import ThreadPoolExecutor
from pathlib import Path

import pytest

import qzacl
from qzacl import Acl, Entry, Order, Requester, Who, to_mask

SOURCE = Path(__file__).resolve().parents[3]
SERVICE = SOURCE / "examples/service.acl"
OWN = qzacl.PermissionSet([(1, "a"), (2, "b", "begin", "to begin"), (4, "b")])

for mechanism in ("unix", "hba2"):
    qzacl.register_expanded(mechanism, qzacl.domain)
qzacl.register_expanded("krb5", qzacl.exact)
qzacl.register_user("krb5", lambda requested, entry: 0 if requested == "root" else 1)
qzacl.register_expanded("bad", lambda requested, entry: {}["key"])


def requester_of(words):
    mechanism, identity, *groups = words
    return Requester() if mechanism == "-" else Requester(mechanism, identity, tuple(group[1:] for group in groups))


@pytest.mark.parametrize("name, order", [
    ("examples/service.cases", Order.CLOSEST),
    ("tests/service_sum.cases", Order.SUM),
])
def test_grants_what_the_cases_say(name, order):
    acl = Acl.read(SERVICE)
    cases = [line.partition("#")[0].split() for line in (SOURCE / name).read_text().splitlines()]
    for *whom, letters, expected in filter(None, cases):
        requester, wanted = requester_of(whom), to_mask(letters)
        answer = qzacl.decide(acl, requester, wanted, order)
        assert answer.allowed == (expected == "yes"), f"{whom}\n{answer.explain()}"
        assert qzacl.granted(acl, requester, order) == answer.granted


def test_explains_itself():
    acl = Acl.from_text("u unix Al@h.x r\ne unix .y w\ne unix .X w\ng Ops x\no\n")
    answer = qzacl.decide(acl, Requester("UNIX", "al@H.x", ("ops", "none")), to_mask("rw"))
    place = {"Al@h.x": "site.acl:1"}
    assert answer.explain(lambda said: place.get(said.entry.identity, "")) == (
        "user: site.acl:1: u unix Al@h.x r (decides)\n"
        "expanded: e unix .X w\n"
        "group: g Ops x\n"
        "group none: no entry\n"
        "any other: o\n"
        "granted: r\n"
        "wanted rw: no\n")
    assert qzacl.decide(acl, Requester()).explain() == "unauthenticated: no entry\ngranted:\n"


def test_tells_who_decided():
    acl = Acl.from_text("n q\nu unix al@h r\ne krb5 h x\ne unix h w\n")
    user, other_user = Requester("unix", "al@h"), Requester("unix", "bob@h")
    rows = [(acl, user, Order.CLOSEST, Who.USER), (acl, user, Order.SUM, Who.SUM),
            (acl, other_user, Order.CLOSEST, Who.EXPANDED), (Acl(), user, Order.SUM, None),
            (acl, Requester(), Order.SUM, Who.UNAUTHENTICATED)]
    for asked, whom, order, who in rows:
        answer = qzacl.decide(asked, whom, order=order)
        assert answer.decided_by is who
        assert answer.granted == qzacl.granted(asked, whom, order)
        assert [said.decides for said in answer.answers if said.entry is None].count(True) == 0
    for whom in user, Requester("krb5", "h"):  # each with the entry of its own mechanism
        assert qzacl.decide(acl, whom).answers[1].entry[2:] == (whom.mechanism, "h")


def test_identities_are_asked_in_their_stored_form():
    rows = [("unix", "a@FE80::0:1", "a@fe80::1"), ("HBA2", "a@::FFFF:102:304", "a@::ffff:1.2.3.4"),
            ("krb5", "a@FE80::0:1", "a@FE80::0:1"), ("unix", "FE80::0:1", "FE80::0:1"), ("unix", "A@H", "A@H")]
    for mechanism, given, stored in rows:
        assert qzacl.stored_identity(mechanism, given) == stored
    assert Entry.create(qzacl.USER, 1, "unix", "a@FE80::0:1").identity == "a@fe80::1"


def test_handlers_know_hosts():
    matching = [("a@h.x", "h.x"), ("a@H.X", "h.x"), ("a@h.x", ".x"), ("a@.x", ".x"), ("a@b@h.x", "h.x")]
    others = [("a@h.x", "x"), ("a@hx", ".x"), ("h.x", "h.x"), ("a@b@h.x", "b@h.x"), ("a@", ""), ("a@h.x", "")]
    others += [("a@x", ".h.x")]
    assert [row for row in matching if not qzacl.domain(*row)] == []
    assert [row for row in others if qzacl.domain(*row)] == []
    assert qzacl.exact("A@h", "a@H")
    assert not qzacl.exact("a@h", "h")


def test_handlers_of_both_kinds(capsys):
    acl = Acl.from_text("u krb5 admin rw\ne bad x r\n")
    assert acl.user("krb5", "root") is None
    assert acl.user("krb5", "root", through_handler=True) == 3
    answer = qzacl.decide(acl, Requester("krb5", "root", through_handler=True))
    assert answer.answers[0].entry == Entry(qzacl.USER, 3, "krb5", "admin")
    assert acl.expanded("bad", "x") is None  # its handler raises
    assert "KeyError: 'key'" in capsys.readouterr().err


def test_texts_and_bytes_lead_back():
    acl = Acl.read(SERVICE)
    assert bytes(Acl.from_text(acl.to_text())) == bytes(acl)
    assert list(Acl.from_bytes(bytes(acl))) == list(acl)
    assert qzacl.same(Acl.from_text("o\nu unix A@h r\ne m b\ne m a"), Acl.from_text("e m b\ne M A\nu unix a@H r\no"))
    assert not qzacl.same(Acl.from_text("e m b\ne m a"), Acl.from_text("e m a\ne m b"))
    assert [entry.identity for entry in Acl.from_text(b"g \xff r\n")] == ["\udcff"]
    assert Acl.from_text("g \udcff r\n").groups(["\udcff"]) == 1
    assert bytes(Acl.from_bytes(b"")) == b"" and list(Acl()) == []


@pytest.mark.parametrize("identity", ["a b", "#a", "n" * 1094])
def test_no_text_holds_what_no_line_can(identity):
    acl = Acl()
    acl.add(Entry(qzacl.GROUP, 1, identity=identity))
    with pytest.raises(qzacl.Error) as raised:
        acl.to_text()
    assert raised.value.code == 43


def test_edits():
    acl, staff = Acl(), Entry(qzacl.GROUP, 1, identity="staff")
    acl.add_new(staff)
    acl.add(staff._replace(permissions=2))
    assert list(acl) == acl.entries(qzacl.GROUP) == [staff._replace(permissions=2)]
    with pytest.raises(qzacl.Error, match="3417-175"):
        acl.add_new(staff)
    acl.remove(staff)
    with pytest.raises(qzacl.Error, match="3417-118"):
        acl.remove(staff)
    # A decision after an edit tells the entries of now.
    for name in ("Ops", "OPS"):
        acl.add_new(Entry(qzacl.GROUP, 1, identity=name))
        assert qzacl.decide(acl, Requester("unix", "a@h", ("ops",))).answers[2].entry.identity == name
        acl.remove(Entry(qzacl.GROUP, 1, identity=name))


def test_sets_of_a_service():
    assert OWN.permissions[1].name == "begin"
    acl = Acl.from_text("o ba\n", OWN)
    assert (acl.any_other(), acl.to_text(OWN), qzacl.to_letters(3, OWN)) == (3, "o ab\n", "ab")
    acl.add(Entry(qzacl.ANY_OTHER, 4))  # "b" is the letter of 2
    with pytest.raises(qzacl.Error, match="lead back"):
        acl.to_text(OWN)
    for wrong in ([(3, "a")], [(1, "ab")], [(1, "a", "n" * 14, "")], [(1 << 32, "a")]):
        with pytest.raises(ValueError):
            qzacl.PermissionSet(wrong)


def test_failures_have_code_number_and_text():
    with pytest.raises(qzacl.Error) as raised:
        Acl.from_text("o r\nx\n")
    assert (raised.value.code, raised.value.number) == (42, "3417-179")
    assert raised.value.text.startswith("3417-179 Failure: ") and "line 2" in str(raised.value)
    refused = [(lambda: Acl.from_bytes(b"none"), 42), (lambda: to_mask("z"), 36), (lambda: Acl.read("/none"), 37),
               (lambda: Entry.create(qzacl.USER, 1, "unix", "no-host"), 4),
               (lambda: Acl.from_text("o r\n").user("unix", ""), 4)]
    for operation, code in refused:
        with pytest.raises(qzacl.Error) as raised:
            operation()
        assert raised.value.code == code
    for operation in (lambda: Acl.read("a\0b"), lambda: Acl().groups(["a\0b"]), lambda: qzacl.to_letters(1 << 32),
                      lambda: Requester("unix"), lambda: Requester("unix", "a@h", "ops")):
        with pytest.raises(ValueError):
            operation()


def test_a_live_acl_keeps_the_last_good_one(tmp_path):
    path = tmp_path / "live.acl"
    live = qzacl.LiveAcl(path)
    with pytest.raises(qzacl.Error):
        live.snapshot()
    for text, letters in ("o r\n", "r"), ("x\n", None), ("o w\n", "w"), ("", ""):
        path.write_text(text)
        if letters is None:
            with pytest.raises(qzacl.Error):
                live.refresh()
            assert live.problem.number == "3417-179"
            continue
        assert live.refresh() and not live.refresh() and live.problem is None
        assert (live.snapshot().any_other() or 0) == to_mask(letters)
        time.sleep(0.05)  # behind the time of the change, that of the file is trusted
        assert not live.refresh()
    with pytest.raises(ValueError):
        live.snapshot().close()


def test_a_live_acl_reads_again_what_is_exchanged_meanwhile(tmp_path, monkeypatch):
    path = tmp_path / "live.acl"
    path.write_text("o r\n")

    def exchange(*arguments, **named):
        monkeypatch.undo()
        path.write_text("o rw\n")
        raise qzacl.Error(37)

    live = qzacl.LiveAcl(path)
    monkeypatch.setattr("qzacl._live.Acl.read", exchange)
    assert live.refresh() and live.snapshot().any_other() == 3


def test_a_live_acl_reads_foreign_caches_only_when_told(tmp_path):
    path, cache = tmp_path / "live.acl", tmp_path / "live.acl.cacl"
    path.write_text("o r\n")
    os.utime(path, (10**9, 10**9))
    cache.write_bytes(bytes(Acl.from_text("o w\n")))
    for told, mask in (False, 1), (True, 2):
        live = qzacl.LiveAcl(path, default_permissions=told)
        live.refresh()
        assert live.snapshot().any_other() == mask


def test_a_live_acl_is_shared_by_threads(tmp_path):
    path, following, done = tmp_path / "live.acl", tmp_path / "next.acl", threading.Event()
    path.write_text("o r\n")
    live = qzacl.LiveAcl(path)
    live.refresh()

    def ask():
        while not done.is_set():
            live.refresh()
            assert qzacl.decide(live.snapshot(), Requester("unix", "a@h")).granted in (1, 2)

    with ThreadPoolExecutor() as threads:
        asking = [threads.submit(ask) for _ in range(3)]
        for text in ["o w\n", "o r\n"] * 10:
            following.write_text(text)
            following.rename(path)
            gc.collect()  # snapshots that nobody holds go
        done.set()
    for each in asking:
        each.result()  # raises what was raised there
    live.refresh()
    assert live.snapshot().any_other() == 1


def test_a_fork_leaves_no_lock_of_a_live_acl_behind(tmp_path, monkeypatch):
    path, is_reading, may_go_on = tmp_path / "live.acl", threading.Event(), threading.Event()
    path.write_text("o r\n")
    live = qzacl.LiveAcl(path)
    with monkeypatch.context() as slow:
        slow.setattr(live, "_refresh_once", lambda: is_reading.set() or may_go_on.wait())
        reader = threading.Thread(target=live.refresh)
        reader.start()
        is_reading.wait()
    child = os.fork()
    if child == 0:
        signal.alarm(20)
        os._exit(0 if live.refresh() and live.snapshot().any_other() == 1 else 1)
    may_go_on.set()
    reader.join()
    assert os.waitpid(child, 0) == (child, 0)


def test_no_text_is_read_through_a_standard_stream(monkeypatch):
    paths, read = [], Acl.read
    monkeypatch.setattr(Acl, "read", lambda path, **rest: paths.append(path) or read(path, **rest))
    kept = os.dup(0)
    os.close(0)
    try:
        assert Acl.from_text("o r\n").any_other() == 1
    finally:
        os.dup2(kept, 0)
        os.close(kept)
    assert int(paths[0].rpartition("/")[2]) > 2
