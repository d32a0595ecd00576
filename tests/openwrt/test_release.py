"""scripts/release: the source tarball that a feed's package is built from."""

import hashlib
import os
import shutil
import subprocess
import tarfile

import pytest
from openwrt.router import FEED_DIR, PACKAGE

from world import CHECKOUT

VERSION = "1.05"
TARBALL = f"{PACKAGE}-{VERSION}.tar.xz"


class Tree:
    """A small checkout with the release script and the package."""

    def __init__(self, top):
        self.top = top
        shutil.copytree(FEED_DIR, top / "openwrt" / PACKAGE)
        (top / "scripts").mkdir()
        shutil.copy(CHECKOUT / "scripts/release", top / "scripts")
        (top / "src/main").mkdir(parents=True)
        (top / "src/CMakeLists.txt").write_text("")
        (top / "src/main/options.cpp").write_text(f'constexpr char VERSION[] = "{VERSION}";\n')
        (top / ".gitignore").write_text("/build/\n")
        self.git("init", "-q")
        self.commit("a start")

    def git(self, *words):
        identity = ["-c", "user.name=Ann", "-c", "user.email=ann@home"]
        subprocess.run(["git", *identity, *words], cwd=self.top, check=True, capture_output=True)

    def commit(self, title):
        self.git("add", "-A")
        self.git("commit", "-q", "-m", title)

    def release(self, **environ):
        """Run the script; returns its CompletedProcess."""
        return subprocess.run([self.top / "scripts/release"], capture_output=True, text=True,
                              check=False, env={**os.environ, **environ})

    @property
    def tarball(self):
        return self.top / "build/dist" / TARBALL

    def hash(self):
        return hashlib.sha256(self.tarball.read_bytes()).hexdigest()

    def makefile(self):
        return (self.top / "openwrt" / PACKAGE / "Makefile").read_text()


@pytest.fixture
def tree(tmp_path):
    return Tree(tmp_path / "tree")


def test_tarball_and_hash_stand_in_the_packages_makefile(tree):
    assert tree.release().returncode == 0
    assert f"TARN_RELEASE_TARBALL:={TARBALL}\n" in tree.makefile()
    assert f"TARN_RELEASE_HASH:={tree.hash()}\n" in tree.makefile()


def test_it_holds_the_sources_and_not_the_package_that_names_its_hash(tree):
    tree.release()
    with tarfile.open(tree.tarball) as archive:
        names = archive.getnames()
        owners = {(member.uid, member.gid, member.uname) for member in archive}
    assert f"{PACKAGE}-{VERSION}/src/main/options.cpp" in names
    assert [name for name in names if "openwrt" in name or ".git/" in name] == []
    assert owners == {(0, 0, "")}


def test_the_same_sources_give_the_same_bytes_elsewhere_and_later(tree, tmp_path):
    tree.release()
    first = tree.hash()
    tree.commit("the package names its tarball")
    elsewhere = tmp_path / "elsewhere"
    subprocess.run(["git", "clone", "-q", tree.top, elsewhere], check=True)
    os.chmod(elsewhere / "src/CMakeLists.txt", 0o600)
    other = Tree.__new__(Tree)
    other.top = elsewhere
    assert other.release(TZ="Asia/Tokyo", LC_ALL="C.UTF-8").returncode == 0
    assert other.hash() == first
    assert other.makefile() == tree.makefile()


def test_other_sources_give_another_hash(tree):
    tree.release()
    first = tree.hash()
    (tree.top / "src/CMakeLists.txt").write_text("# more\n")
    tree.commit("more")
    tree.release()
    assert tree.hash() != first


def test_what_is_not_committed_is_not_released(tree):
    (tree.top / "src/CMakeLists.txt").write_text("# mine alone\n")
    done = tree.release()
    assert done.returncode != 0
    assert "commit" in done.stderr
    assert not tree.tarball.exists()


def test_a_program_of_another_version_is_not_released(tree):
    (tree.top / "src/main/options.cpp").write_text('constexpr char VERSION[] = "1.06";\n')
    tree.commit("another version")
    done = tree.release()
    assert done.returncode != 0
    assert VERSION in done.stderr
    assert f"TARN_RELEASE_TARBALL:={TARBALL}" not in tree.makefile()


def test_without_its_tree_the_package_is_built_from_the_released_tarball(tree, buildroot, tmp_path):
    tree.release()
    feed = tmp_path / "feed/utils" / PACKAGE
    shutil.copytree(tree.top / "openwrt" / PACKAGE, feed)
    shown = buildroot.show(PACKAGE, feed=feed)
    assert shown["SOURCE"].strip() == TARBALL
    assert shown["HASH"].strip() == tree.hash()
    buildroot.make("prepare", f"DL_DIR={tree.tarball.parent}", feed=feed)
    assert "src" in os.listdir(buildroot.top / "stage/build")


def test_within_its_tree_the_package_is_built_from_the_tree(tree, buildroot):
    tree.release()
    shown = buildroot.show(PACKAGE, feed=tree.top / "openwrt" / PACKAGE)
    assert shown["SOURCE"].strip() == ""
    assert str(tree.top / "src") in shown["FILE_DEPENDS"].split()
