"""The feed package: what its Makefile installs, depends on and tells CMake."""

import json
import os
import re
import subprocess

import pytest
from openwrt.router import FEED_DIR, PACKAGE

from world import CHECKOUT

HELPERS = "usr/lib/tarn-nas-diskmanager"
EXECUTABLE = ["etc/init.d/tarn_nas_diskmanager", "usr/bin/disk_get_label.sh",
              "usr/bin/tarn_nas_diskmanager", f"{HELPERS}/heart_beat", f"{HELPERS}/run_daemon",
              f"{HELPERS}/tarn_nas_disk_log"]
PLAIN = ["etc/config/tarn_nas_diskmanager", "etc/hotplug.d/block/60-tarn_nas_diskmanager",
         "lib/upgrade/keep.d/tarn-nas-diskmanager", "usr/lib/libtarn-utils.so", f"{HELPERS}/pipe.sh"]
LIBRARY = "CONFIG_TARN_NAS_DISKMANAGER_TARN_UTILS_LIBRARY"


def files(root):
    return sorted(str(path.relative_to(root)) for path in root.rglob("*") if path.is_file())


def test_every_file_lies_where_the_router_looks_for_it(buildroot):
    root = buildroot.install(PACKAGE, f"{PACKAGE}-label")
    assert files(root) == sorted(EXECUTABLE + PLAIN)
    assert [name for name in EXECUTABLE if not os.access(root / name, os.X_OK)] == []


def test_the_label_script_is_a_package_of_its_own(buildroot):
    assert "usr/bin/disk_get_label.sh" not in files(buildroot.install(PACKAGE))
    assert "+tarn-nas-diskmanager" in buildroot.show(f"{PACKAGE}-label")["DEPENDS"]


def test_the_hotplug_script_has_not_the_name_that_the_daemon_deletes(buildroot):
    root = buildroot.install(PACKAGE)
    assert "10-mount" not in os.listdir(root / "etc/hotplug.d/block")


@pytest.mark.parametrize("word", [
    "+libuci", "+libsqlite3", "+cJSON", "+blkid", ":kmod-fs-vfat", ":kmod-nls-utf8", ":kmod-fs-exfat",
    ":kmod-fs-ext4", ":ntfs-3g", ":kmod-fs-hfsplus", ":kmod-usb-storage"])
def test_a_dependency_is_named(buildroot, word):
    depends = buildroot.show(PACKAGE)["DEPENDS"].split()
    assert [entry for entry in depends if entry.endswith(word)]


def test_each_conditional_dependency_has_its_menu_entry(buildroot):
    menu = (FEED_DIR / "Config.in").read_text()
    assert conditions(buildroot)
    assert [name for name in conditions(buildroot) if f"config {name}\n" not in menu] == []


def conditions(buildroot):
    """Menu entries of the package's own among the conditions of its dependencies."""
    entries = buildroot.show(PACKAGE)["DEPENDS"].split()
    return {entry[1:].split(":")[0] for entry in entries if ":" in entry} - {"USB_SUPPORT"}


def test_no_menu_entry_has_a_condition_that_a_chosen_package_sets(buildroot):
    # kmod-usb-storage and kmod-mmc do; behind an entry of this package's the buildroot calls that a recursion.
    chosen = [entry for entry in buildroot.show(PACKAGE)["DEPENDS"].split() if "usb" in entry or "mmc" in entry]
    assert chosen == ["+USB_SUPPORT:kmod-usb-storage", "+USB_SUPPORT:kmod-usb-storage-uas"]
    assert "depends on" not in (FEED_DIR / "Config.in").read_text()


def kept_over_an_upgrade(root):
    return (root / "lib/upgrade/keep.d/tarn-nas-diskmanager").read_text().splitlines()


def test_setting_database_and_the_stand_ins_setting_survive_an_upgrade(buildroot):
    root = buildroot.install(PACKAGE)
    assert buildroot.show(PACKAGE)["CONFFILES"].split() == [
        "/etc/config/tarn_nas_diskmanager", "/etc/config/tarn_nas/", "/etc/tarn_utils/"]
    # The first is a file of the package's, which the package manager keeps.
    assert kept_over_an_upgrade(root) == ["/etc/config/tarn_nas/", "/etc/tarn_utils/"]


@pytest.fixture
def makers_library(tmp_path):
    """Setting that names a library of the maker's, whose version is part of its name for the linker."""
    library = tmp_path / "libtarn-utils.so"
    subprocess.run(["cc", "-shared", "-Wl,-soname,libtarn-utils.so.3", "-o", library, "-x", "c", "/dev/null"],
                   check=True)
    return f'{LIBRARY}="{library}"'


def test_the_makers_library_takes_the_place_of_the_stand_in(buildroot, makers_library):
    path = makers_library.split('"')[1]
    assert f"-DTARN_UTILS_LIBRARY={path}" in buildroot.show(PACKAGE, makers_library)["CMAKE_OPTIONS"]
    buildroot.make(f"install-{PACKAGE}", makers_library)
    root = buildroot.top / "stage/root"
    assert "usr/lib/libtarn-utils.so" not in files(root)
    assert kept_over_an_upgrade(root) == ["/etc/config/tarn_nas/"]


def test_the_buildroot_is_told_which_library_the_program_needs(buildroot, makers_library):
    buildroot.make(f"install-{PACKAGE}", makers_library)
    assert buildroot.provides(PACKAGE, makers_library) == {"libtarn-utils.so.3"}


def test_the_stand_in_is_provided_by_the_package_itself(buildroot):
    buildroot.install(PACKAGE)
    assert buildroot.provides(PACKAGE) == {"libtarn-utils.so"}


def test_a_question_of_the_menu_chooses_the_prompt_build(buildroot):
    assert "config TARN_NAS_DISKMANAGER_PROMPT\n" in (FEED_DIR / "Config.in").read_text()
    for setting, waits in (((), "steady"), (("CONFIG_TARN_NAS_DISKMANAGER_PROMPT=y",), "prompt")):
        assert f"-DDISKMANAGER_WAITS={waits}" in buildroot.show(PACKAGE, *setting)["CMAKE_OPTIONS"].split()


@pytest.mark.parametrize("given, waits", [((), "steady"), (("-DDISKMANAGER_WAITS=prompt",), "prompt")])
def test_whoever_builds_without_naming_the_waits_gets_the_steady_ones(tmp_path, given, waits):
    # A preset and the package's Makefile name what they want; a plain call of CMake does not.
    subprocess.run(["cmake", "-S", CHECKOUT, "-B", tmp_path, "-DDISKMANAGER_UNIT_TESTS=OFF", *given],
                   check=True, capture_output=True)
    commands = json.loads((tmp_path / "compile_commands.json").read_text())
    own = [entry["command"] for entry in commands if "/src/" in entry["file"]]
    assert own
    assert {word for command in own for word in command.split() if "DISKMANAGER_WAITS" in word} == {
        f"-DDISKMANAGER_WAITS={waits}"}


def test_cmake_knows_each_option_that_it_is_given(buildroot):
    known = (CHECKOUT / "CMakeLists.txt").read_text()
    words = buildroot.show(PACKAGE)["CMAKE_OPTIONS"].split()
    names = [word[2:].split("=")[0] for word in words]
    assert len(names) >= 3
    assert [name for name in names if f"{name} " not in known] == []


def test_whoever_publishes_the_package_says_who_he_is(buildroot):
    shown = buildroot.show(PACKAGE, "TARN_MAINTAINER=Ann Other <ann@home>", "TARN_URL=https://home/")
    assert shown["MAINTAINER"] == "Ann Other <ann@home> "
    assert shown["URL"] == "https://home/ "
    assert buildroot.show(PACKAGE)["MAINTAINER"].strip() == ""


def test_no_host_is_named_as_the_place_of_the_sources(buildroot):
    assert buildroot.show(PACKAGE)["SOURCE_URL"].strip() == ""
    assert "http" not in (FEED_DIR / "Makefile").read_text()


def test_the_sources_of_this_tree_are_copied_without_its_builds(buildroot):
    buildroot.make("prepare")
    prepared = set(os.listdir(buildroot.top / "stage/build"))
    assert {"CMakeLists.txt", "cmake", "src", "platform"} <= prepared
    assert not {"build", ".git", "tests"} & prepared


def test_a_change_in_whatever_is_copied_and_built_makes_the_buildroot_prepare_anew(buildroot):
    watched = buildroot.show(PACKAGE)["FILE_DEPENDS"].split()
    assert all(os.path.exists(path) for path in watched)
    buildroot.make("prepare")
    copied = set(os.listdir(buildroot.top / "stage/build"))
    assert {os.path.basename(path) for path in watched} == copied - {"LICENSE"}


def test_a_tarball_is_unpacked_into_the_build_directory_whatever_its_top_directory(buildroot, tmp_path):
    (tmp_path / "release-of-today/src").mkdir(parents=True)
    (tmp_path / "release-of-today/CMakeLists.txt").touch()
    subprocess.run(["tar", "-C", tmp_path, "-cJf", tmp_path / "sources.tar.xz", "release-of-today"], check=True)
    buildroot.make("prepare", f"DL_DIR={tmp_path}", "TARN_SOURCE_TARBALL=sources.tar.xz")
    assert set(os.listdir(buildroot.top / "stage/build")) == {"CMakeLists.txt", "src"}
    assert set(os.listdir(buildroot.top / "stage")) == {"build", "install"}


def run_package_check(router, *words):
    """The package's test.sh as a feed's checks run it; returns whether it passed."""
    router.world.tools.stub("uci", f"[ \"$*\" = 'get {PACKAGE.replace('-', '_')}.log.full' ] && echo 0")
    router.world.write("/tmp/test.sh", (FEED_DIR / "test.sh").read_text())
    return router.world.run("/bin/sh", "/tmp/test.sh", *words, check=False).returncode == 0


def test_the_packages_own_check_passes_on_what_is_installed(make_router, real_daemon):
    router = make_router(real_daemon)
    version = re.search(r"^PKG_VERSION:=(.*)$", (FEED_DIR / "Makefile").read_text(), re.MULTILINE).group(1)
    assert run_package_check(router, PACKAGE, version)
    assert run_package_check(router, f"{PACKAGE}-label", version)


@pytest.mark.parametrize("words", [(PACKAGE, "1.0"), (PACKAGE, "11.05"), ("another-package", "1.05")])
def test_the_packages_own_check_refuses(make_router, real_daemon, words):
    assert not run_package_check(make_router(real_daemon), *words)


@pytest.mark.parametrize("damaged", ["/etc/init.d/tarn_nas_diskmanager",
                                     "/usr/lib/tarn-nas-diskmanager/heart_beat"])
def test_the_packages_own_check_finds_a_damaged_script(make_router, real_daemon, damaged):
    router = make_router(real_daemon)
    router.world.write(damaged, "if\n", 0o755)
    assert not run_package_check(router, PACKAGE, "1.05")
