"""Packages: made, shown, and refused."""

import os
import plistlib

import subprocess

import pytest

import packages
from conftest import names_of

LABELS = ["parent-name", "parent-inside", "absolute-name", "backslash-name", "link", "device", "pipe",
          "file-as-directory", "no-bundle", "two-bundles", "no-info", "damaged-info", "info-not-a-map",
          "no-identifier", "dots-identifier", "slash-identifier", "long-identifier", "duplicate-entry",
          "empty", "not-a-zip", "cut-off-end", "cut-in-half", "wrong-crc", "names-differ",
          "false-count", "encrypted", "bomb"]


@pytest.fixture(scope="module")
def hostile(tmp_path_factory):
    return dict(packages.hostile_packages(str(tmp_path_factory.mktemp("hostile"))))


def test_every_hostile_package_has_its_case(hostile):
    assert sorted(hostile) == sorted(LABELS)


@pytest.mark.parametrize("label", LABELS)
def test_hostile_package_is_refused_and_the_good_one_installed(device, tmp_path, hostile, label):
    folder = tmp_path / "lib"
    packages.make_package(str(folder), "com.example.good")
    os.link(hostile[label], folder / "bad.zip")
    result = device.sync(folder, expect=1)
    assert len(result["failed"]) == 1
    assert result["failed"][0]["error"]
    assert names_of(result["installed"]) == ["com.example.good"]
    assert sorted(device.apps()) == ["com.example.good"]
    assert device.placeholders() == []
    assert len(os.listdir(device.inside("/var/containers/Bundle/Application"))) == 1


@pytest.mark.parametrize("label", [label for label in LABELS if label != "wrong-crc"])
def test_show_says_what_is_wrong_in_one_line(appsync, hostile, label):
    done = appsync("package", "show", hostile[label], expect=None)
    assert done.returncode in (1, 3)
    assert len(done.stderr.strip().splitlines()) == 1


def test_damaged_update_keeps_the_old_version(device, library, tmp_path):
    device.sync(library)
    good = packages.make_package(str(tmp_path / "next"), "com.example.app00", "2.0")
    with open(good, "rb") as file:
        data = packages._with_wrong_crc(file.read())
    with open(os.path.join(library, "com.example.app00.zip"), "wb") as file:
        file.write(data)
    device.sync(library, expect=1)
    assert device.versions()["com.example.app00"] == "1.0"
    assert device.placeholders() == []
    with open(os.path.join(device.container_of("com.example.app00"), "App00.app", "main"), "rb") as file:
        assert file.read()


def test_make_and_show(appsync, device, tmp_path):
    folder = tmp_path / "folder"
    for name, data in packages.entries("com.example.made", "4.2"):
        path = folder / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(data)
    library = tmp_path / "lib"
    library.mkdir()
    appsync("package", "make", folder, library / "made.zip")
    shown = appsync("package", "show", library / "made.zip").stdout
    assert "com.example.made" in shown and "4.2" in shown
    device.sync(library)
    assert device.versions() == {"com.example.made": "4.2"}


def test_make_refuses_a_package_in_the_bundle_that_it_packs(appsync, tmp_path):
    bundle = tmp_path / "folder" / "My.app"
    bundle.mkdir(parents=True)
    (bundle / "Info.plist").write_bytes(plistlib.dumps(packages.info("com.example.my")))
    before = sorted(os.listdir(bundle))
    for folder in (tmp_path / "folder", bundle):
        done = appsync("package", "make", folder, bundle / "out.zip", expect=1)
        assert "lies in the bundle" in done.stderr and done.stderr.count("\n") == 1
    assert sorted(os.listdir(bundle)) == before
    appsync("package", "make", tmp_path / "folder", tmp_path / "folder" / "out.zip")
    assert appsync.json("package", "show", tmp_path / "folder" / "out.zip")["identifier"] == "com.example.my"


def test_make_refuses_a_folder_without_a_bundle(appsync, tmp_path):
    (tmp_path / "folder").mkdir()
    done = appsync("package", "make", tmp_path / "folder", tmp_path / "out.zip", expect=None)
    assert done.returncode in (1, 2, 3) and len(done.stderr.strip().splitlines()) == 1
    assert not (tmp_path / "out.zip").exists()


def hostile_icon(kind, path):
    if kind == "not-a-picture":
        path.write_bytes(b"GIF89a" + bytes(200))
    elif kind == "huge":
        data = bytearray(packages.png())
        data[16:24] = b"\x7f\xff\xff\xff" * 2
        path.write_bytes(bytes(data))
    elif kind == "truncated":
        path.write_bytes(packages.png()[:60])


@pytest.mark.parametrize("kind", ["not-a-picture", "huge", "truncated"])
def test_hostile_icon_does_not_stop_the_install(device, tmp_path, kind, appsync):
    icon = tmp_path / "icon"
    hostile_icon(kind, icon)
    items = [(name, icon.read_bytes() if name.endswith("Icon.png") else data)
             for name, data in packages.entries("com.example.icon")]
    (tmp_path / "lib").mkdir()
    packages.write_zip(str(tmp_path / "lib" / "icon.zip"), items)
    device.sync(tmp_path / "lib")
    assert sorted(device.apps()) == ["com.example.icon"]
    appsync("screen", device.path, tmp_path / "out.png")


def test_binary_info_is_read(device, tmp_path):
    packages.make_package(str(tmp_path / "lib"), "com.example.binary", fmt=plistlib.FMT_BINARY)
    device.sync(tmp_path / "lib")
    assert sorted(device.apps()) == ["com.example.binary"]


@pytest.mark.plain_build
def test_memory_does_not_grow_with_the_package(appsync, device, tmp_path):
    chunk = os.urandom(1 << 20)
    items = packages.entries("com.example.large", payload=b"")
    path = tmp_path / "lib" / "large.zip"
    path.parent.mkdir()
    packages.write_zip(str(path), items)
    import zipfile

    with zipfile.ZipFile(path, "a", zipfile.ZIP_STORED) as archive:
        with archive.open(packages.entry("Large.app/large.bin", method=zipfile.ZIP_STORED), "w") as out:
            for _ in range(300):
                out.write(chunk)
    script = ("import resource,subprocess,sys\n"
              "r=subprocess.run(sys.argv[1:],stdout=subprocess.DEVNULL)\n"
              "print(r.returncode,resource.getrusage(resource.RUSAGE_CHILDREN).ru_maxrss)")
    out = subprocess.run(["/usr/bin/python3", "-c", script, appsync.program, "sync", device.path,
                          str(path.parent)], capture_output=True, text=True, check=True).stdout
    status, kilobytes = map(int, out.split())
    assert status == 0
    assert kilobytes < 64 * 1024


def refusal(appsync, *arguments, expect):
    done = appsync(*arguments, expect=expect)
    assert done.stdout == ""
    assert done.stderr.count("\n") == 1
    return done.stderr


def test_what_cannot_be_made_says_what_where_and_what_to_do(appsync, tmp_path):
    good = tmp_path / "good"
    (good / "A.app").mkdir(parents=True)
    (good / "A.app" / "Info.plist").write_bytes(plistlib.dumps({"BundleIdentifier": "com.a"}))
    missing = str(tmp_path / "missing")
    told = refusal(appsync, "package", "make", missing, tmp_path / "out.zip", expect=1)
    assert missing in told and "name the one that holds <Name>.app" in told
    told = refusal(appsync, "package", "make", good, missing + "/out.zip", expect=1)
    assert missing in told and "create it" in told
    assert "name the package to write" in refusal(appsync, "package", "make", good, "", expect=1)
    told = refusal(appsync, "create", missing + "/device", expect=3)
    assert missing + "/device" in told and "create that first" in told
    assert "give that of a new one" in refusal(appsync, "create", "", expect=2)
    assert os.listdir(tmp_path) == ["good"]
