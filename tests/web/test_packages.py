"""The two packages: what they install, and that page, menu, access list, translations and plugin fit together."""

import json
import os
import re
import shutil
import subprocess

import pytest
from web.exchange import METHODS, SCHEMAS, words
from web.router import BUILDROOT, OBJECT, OPENWRT, PAGE_PACKAGE, PLUGIN_PACKAGE
from web.server import ACCESS, SOURCE, granted, menu_entry, read_po

RESOURCES = SOURCE / "htdocs/luci-static/resources"
SCRIPTS = sorted(RESOURCES.rglob("*.js"))
TEMPLATE = SOURCE / "po/templates/tarn-nas-diskmanager.pot"
GERMAN = SOURCE / "po/de/tarn-nas-diskmanager.po"
# Both are caught or answered by the page itself.
ERRORS_WITHOUT_TEXT = {"invalid_argument", "not_mounted"}


def files(root):
    return sorted(str(path.relative_to(root)) for path in root.rglob("*") if path.is_file())


def script_text():
    return "\n".join(path.read_text() for path in SCRIPTS)


@pytest.fixture
def luci_buildroot(tmp_path):
    """A buildroot that has LuCI's feed."""
    top = tmp_path / "top"
    shutil.copytree(BUILDROOT, top)
    shutil.copytree(OPENWRT.parent / "tests/web/buildroot", top, dirs_exist_ok=True)
    return top


def make(top, package, *targets):
    return subprocess.run(["make", "-s", "-C", OPENWRT / package, f"TOPDIR={top}", *targets],
                          check=True, capture_output=True, text=True).stdout


def test_the_plugin_lies_where_rpcd_looks_for_it(plugin_root, figure):
    assert files(plugin_root) == ["usr/lib/tarn-nas-diskmanager/inventory.sh", f"usr/libexec/rpcd/{OBJECT}"]
    assert os.access(plugin_root / f"usr/libexec/rpcd/{OBJECT}", os.X_OK)
    figure("contents of the plugin's package", f"{size(plugin_root)} bytes")


def size(root):
    return sum(path.stat().st_size for path in root.rglob("*") if path.is_file())


def test_the_plugins_package_brings_what_it_needs():
    depends = make(BUILDROOT, PLUGIN_PACKAGE, f"show-{PLUGIN_PACKAGE}").splitlines()[0].split()
    assert {"+rpcd", "+jshn", "+tarn-nas-diskmanager"} <= set(depends)


def test_rpcd_looks_for_the_plugin_when_the_package_comes_and_goes():
    text = (OPENWRT / PLUGIN_PACKAGE / "Makefile").read_text()
    for name in ("postinst", "postrm"):
        script = text.split(f"Package/{PLUGIN_PACKAGE}/{name}\n")[1].split("endef")[0]
        assert '[ -n "$${IPKG_INSTROOT}" ] || killall -HUP rpcd' in script


def test_the_pages_package_installs_view_menu_and_access_list(luci_buildroot, tmp_path, figure):
    make(luci_buildroot, PAGE_PACKAGE, f"STAGE={tmp_path}", f"install-{PAGE_PACKAGE}")
    assert files(tmp_path / "root") == [
        f"usr/share/luci/menu.d/{PAGE_PACKAGE}.json", f"usr/share/rpcd/acl.d/{PAGE_PACKAGE}.json",
        *(f"www/{path.relative_to(SOURCE / 'htdocs')}" for path in SCRIPTS)]
    figure("contents of the page's package", f"{size(tmp_path / 'root')} bytes before LuCI's minifier")


def test_the_pages_package_names_its_version_and_the_plugin(luci_buildroot):
    assert re.fullmatch(r"[\d.]+ \d+ [\d.]+", make(luci_buildroot, PAGE_PACKAGE, "show-versions").strip())
    depends = make(luci_buildroot, PAGE_PACKAGE, f"show-{PAGE_PACKAGE}").splitlines()[0].split()
    assert {"+luci-base", f"+{PLUGIN_PACKAGE}"} <= set(depends)


def test_the_menu_leads_to_the_view_for_those_whom_the_access_list_names():
    path, entry = menu_entry()
    assert path.startswith("admin/system/")
    assert (RESOURCES / f"view/{entry['action']['path']}.js").exists()
    assert entry["depends"]["acl"] == list(json.loads(ACCESS.read_text()))


def test_every_method_is_granted_once_and_removals_only_for_writing():
    reading, writing = granted(["read"]), granted(["write"])
    assert reading == {(OBJECT, "list")}
    assert writing == {(OBJECT, method) for method in METHODS if method != "list"}


def test_every_call_of_the_page_is_granted_and_declared_by_the_plugin(plugin):
    calls = set(re.findall(r"object: '(\w+)', method: '(\w+)'", script_text()))
    assert len(calls) == script_text().count("rpc.declare(") == 3
    assert calls <= granted(["read", "write"])
    assert {method for _, method in calls} <= set(plugin.methods()) == set(SCHEMAS)


def test_every_word_of_an_answer_has_a_text():
    texts = (RESOURCES / "tarn_nas_diskmanager/texts.js").read_text()
    reasons, errors = (set(re.findall(r"^\t\t(\w+):", half, re.MULTILINE)) for half in texts.split("\terrors: {"))
    assert reasons == {*words("part"), *words("unused"), "settling", "unplug"}
    known = {word for method in METHODS
             for word in SCHEMAS[method]["properties"]["answer"]["properties"].get("error", {}).get("enum", ())}
    assert errors == known - ERRORS_WITHOUT_TEXT


def test_every_text_is_in_the_template_and_in_german():
    said = {text.replace("\\'", "'") for text in re.findall(r"_\('((?:[^'\\]|\\.)*)'\)", script_text())}
    assert len(re.findall(r"\b_\(", script_text())) == len(re.findall(r"_\('(?:[^'\\]|\\.)*'\)", script_text()))
    said.add(menu_entry()[1]["title"])
    said.update(group["description"] for group in json.loads(ACCESS.read_text()).values())
    german = read_po(GERMAN.read_text())
    assert said == set(read_po(TEMPLATE.read_text())) == set(german)
    assert [text for text, other in german.items() if not other or text.count("%s") != other.count("%s")] == []


def test_the_scripts_hold_nothing_that_luci_minifier_is_known_to_break():
    for path in SCRIPTS:
        text = path.read_text()
        assert "`" not in text and "//" not in text, path
        assert not re.search(r"[(=,:]\s*/[^*/\s]", text), f"a regular expression in {path}"
