import pathlib
import shutil
import subprocess

import pytest

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
PARTS = ["CMakeLists.txt", "CONTRIBUTING.md", "cmake", "docs", "scripts", "client", "platform", "system", "simulation",
         "checked", "recording", "contract"]


@pytest.fixture
def tree(tmp_path):
    for name in PARTS:
        source = ROOT / name
        (shutil.copytree if source.is_dir() else shutil.copy)(source, tmp_path / name)
    return tmp_path


def docs(tree):
    return subprocess.run([tree / "scripts" / "docs"], capture_output=True, text=True)


def test_every_header_has_a_page_and_the_documents_have_theirs(tree):
    done = docs(tree)
    assert done.returncode == 0, done.stderr
    pages = {path.name for path in (tree / "build" / "reference").iterdir()}
    for name in ("index.html", "AppRegistry_8h.html", "AppsClient_8h.html", "SystemWorkQueues_8h.html",
                 "SimulatedPlatform_8h.html", "classappsync_1_1SyncClient.html", "md_docs_device_format.html"):
        assert name in pages


@pytest.mark.parametrize("comment", ["/// See #appsync::NoSuchThing.", "/// A <list>.",
                                     "/// @nosuchcommand"])
def test_a_comment_that_is_wrong_is_told_with_its_line(tree, comment):
    header = tree / "platform" / "SyncClient.h"
    text = header.read_text()
    header.write_text(text.replace("class SyncClient {", comment + "\nclass SyncClient {"))
    done = docs(tree)
    assert done.returncode != 0
    assert "platform/SyncClient.h:" in done.stderr
