"""The source tree: which commit it is, and how what a campaign runs is built."""

import fcntl
import hashlib
import os
import pathlib
import subprocess

ROOT = pathlib.Path(__file__).resolve().parent.parent.parent
WORK = ROOT / "build" / "campaign"
CODE = [".", ":(exclude)docs", ":(exclude,glob)*.md"]  # all but documents

# What must be built for a kind, by the name that a kind calls it.
BUILDS = {
    "release": [
        ["cmake", "--preset", "release"],
        ["cmake", "--build", "--preset", "release", "--target", "test_reliability", "test_recordings", "appsync"],
    ],
    "fuzz": [["cmake", "--preset", "fuzz"], ["cmake", "--build", "--preset", "fuzz"]],
    "mutate": [["/usr/bin/python3", "scripts/mutate", "--prepare"]],
}


class Refusal(Exception):
    """Why something cannot be done, as a sentence for who asked for it."""


def git(*words, tree=ROOT):
    return subprocess.run(["git", *words], cwd=tree, capture_output=True, check=False)


def commit_of(tree=ROOT):
    """The last commit that changed more than documents, so that sums can be kept in the tree and the campaign go on; where
    the tree differs from that, with a mark of how.
    """
    head = git("log", "-1", "--format=%H", "--", *CODE, tree=tree)
    if head.returncode != 0:
        raise Refusal("this tree has no commit: a campaign needs a clone")
    commit = head.stdout.decode().strip()
    changes = git("diff", "HEAD", "--binary", "--", *CODE, tree=tree).stdout + new_files(tree)
    return f"{commit}+{hashlib.sha256(changes).hexdigest()[:8]}" if changes else commit


def new_files(tree):
    """Names and contents of what is not yet part of the tree."""
    names = git("ls-files", "--others", "--exclude-standard", "-z", "--", *CODE, tree=tree).stdout.split(b"\0")
    paths = [pathlib.Path(tree, os.fsdecode(name)) for name in sorted(names) if name]
    return b"".join(os.fsencode(path.name) + path.read_bytes() for path in paths if path.is_file())


def tree_at(commit):
    """A tree of that commit: this one, or one that is checked out beside its builds."""
    if commit_of() == commit:
        return ROOT
    if "+" in commit:
        raise Refusal(f"the campaign runs a tree that is changed ({commit}), and only that tree itself can work for it")
    if git("cat-file", "-e", f"{commit}^{{commit}}").returncode != 0:
        raise Refusal(f"this tree does not have the commit {commit} that the campaign asks for: fetch it first")
    tree = WORK / "tree"
    if not (tree / ".git").exists():
        git("worktree", "prune")
        done = git("worktree", "add", "--force", "--detach", str(tree), commit)
    else:
        done = git("checkout", "--force", "--detach", commit, tree=tree)
    if done.returncode != 0:
        raise Refusal(f"the commit {commit} cannot be checked out: {done.stderr.decode(errors='replace').strip()}")
    return tree


def build(name, tree):
    """Builds it, one at a time of those who ask for it on this machine."""
    folder = tree / "build"
    folder.mkdir(exist_ok=True)
    with open(folder / "campaign.lock", "w") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        for command in BUILDS[name]:
            done = subprocess.run(
                command, cwd=tree, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, errors="replace",
                check=False,
            )
            if done.returncode != 0:
                raise Refusal(f"{' '.join(command)} fails in {tree}:\n{done.stdout[-4000:]}")
