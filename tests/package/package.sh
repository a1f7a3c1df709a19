#!/usr/bin/env bash
# The Debian package as a user gets it: a hardened Release build, `cpack -G DEB`, lintian, then
# the extracted files (contents, dependencies, units, desktop entry, manual pages, maintainer
# scripts) and the extracted agent started by its socket, answering and exiting when idle.
# usage: package.sh SOURCE_DIR WORK_DIR   (WORK_DIR keeps the Release build between runs)
set -uo pipefail

source_dir=$(cd "${1:?usage: package.sh SOURCE_DIR WORK_DIR}" && pwd)
work=${2:?usage: package.sh SOURCE_DIR WORK_DIR}
app_id=org.glyphwell.Glyphwell.GlyphwellUIAgent
unit=glyphwell-ui-agent.socket

fail() {
    echo "FAIL: $*" >&2
    exit 1
}
for tool in cpack dpkg-deb dpkg-buildflags dpkg-shlibdeps lintian desktop-file-validate man \
    systemd-analyze systemd-socket-activate; do
    command -v "$tool" >/dev/null || fail "$tool is missing: run scripts/install-deps"
done

mkdir -p "$work"
build="$work/build"
tmp=$(mktemp -d /tmp/glyphwell-package-XXXXXX)
trap 'rm -rf "$tmp"' EXIT
root="$tmp/root"

# --- Build: Release, Debian's hardening flags, only what the package holds.
(
    cd "$source_dir" || exit 1
    eval "$(DEB_BUILD_MAINT_OPTIONS=hardening=+all DEB_CFLAGS_MAINT_STRIP=-g \
        DEB_CXXFLAGS_MAINT_STRIP=-g dpkg-buildflags --export=sh)"
    export CFLAGS="$CFLAGS $CPPFLAGS" CXXFLAGS="$CXXFLAGS $CPPFLAGS"
    cmake -S "$source_dir" -B "$build" -G Ninja -DCMAKE_BUILD_TYPE=Release \
        -DCMAKE_INSTALL_PREFIX=/usr -DCMAKE_INSTALL_SYSCONFDIR=/etc -DGLYPHWELL_TESTS=OFF \
        -DGLYPHWELL_SANITIZE=OFF -DGLYPHWELL_BENCH=OFF -DGLYPHWELL_FUZZ=OFF \
        >"$work/configure.log" 2>&1 ||
        { cat "$work/configure.log" >&2; exit 1; }
    cmake --build "$build" -j 2 >"$work/build.log" 2>&1 || { tail -50 "$work/build.log" >&2; exit 1; }
    rm -f "$build"/*.deb
    (cd "$build" && cpack -G DEB) >"$work/cpack.log" 2>&1 || { cat "$work/cpack.log" >&2; exit 1; }
) || fail "the package could not be built"

# --- Destinations: an install into another prefix writes only below it, but for the /etc files
# that the package build (like Debian's cmake helper) asks for; DESTDIR keeps those in $tmp too.
DESTDIR="$tmp/destdir" cmake --install "$build" --prefix "$tmp/prefix" >"$work/install.log" 2>&1 ||
    { cat "$work/install.log" >&2; fail "cmake --install into a temporary prefix failed"; }
outside=$(grep -v -e "^$tmp/prefix/" -e "^/etc/" "$build/install_manifest.txt")
[ -z "$outside" ] || fail "installed outside the prefix: $outside"
grep -q "^$tmp/prefix/lib/systemd/user/$unit\$" "$build/install_manifest.txt" ||
    fail "the install manifest lacks the socket unit"

version=$(sed -n '1s/^glyphwell (\([^)]*\)).*/\1/p' "$source_dir/resources/debian/changelog")
deb="$build/glyphwell_${version}_$(dpkg --print-architecture).deb"
[ -f "$deb" ] || fail "cpack made $(cd "$build" && ls -- *.deb 2>/dev/null), not $(basename "$deb")"
echo "built $(basename "$deb")"

# --- lintian: errors fail; everything else is shown.
lintian --fail-on error --display-info --tag-display-limit 0 "$deb" >"$tmp/lintian.log" 2>&1
lintian_status=$?
sed 's/^/lintian: /' "$tmp/lintian.log"
[ "$lintian_status" = 0 ] || fail "lintian reports errors"

dpkg-deb -x "$deb" "$root" || fail "dpkg-deb -x failed"
dpkg-deb -e "$deb" "$tmp/control" || fail "dpkg-deb -e failed"

# --- Contents and dependencies.
for file in usr/libexec/GlyphwellUIAgent usr/libexec/glyphwell-bus-bridge \
    usr/libexec/glyphwell-bus-bridge-worker usr/bin/glyphwell; do
    [ -x "$root/$file" ] || fail "/$file is missing or not executable"
done
for file in usr/lib/systemd/user/$unit usr/lib/systemd/user/glyphwell-ui-agent.service \
    usr/lib/systemd/user/glyphwell-catalog-refresh.timer \
    usr/lib/systemd/user/glyphwell-catalog-refresh.service \
    usr/lib/systemd/user/glyphwell-bus-bridge.service \
    etc/xdg/autostart/glyphwell-bus-bridge.desktop etc/X11/Xsession.d/90glyphwell-gtk-module \
    usr/lib/environment.d/90-glyphwell-gtk-module.conf usr/share/man/man8/glyphwell-bus-bridge.8.gz \
    usr/share/applications/$app_id.desktop usr/share/icons/hicolor/scalable/apps/$app_id.svg \
    usr/share/applications/org.glyphwell.Glyphwell.GetMissingFonts.desktop \
    usr/share/man/man1/glyphwell.1.gz usr/share/man/man8/GlyphwellUIAgent.8.gz \
    usr/share/doc/glyphwell/copyright \
    usr/share/doc/glyphwell/changelog.Debian.gz usr/share/doc/glyphwell/help/index.html; do
    [ -s "$root/$file" ] || fail "/$file is missing"
done
# The client library, once built, comes with its development files, a shlibs file and ldconfig.
multiarch=$(dpkg-architecture -qDEB_HOST_MULTIARCH)
if compgen -G "$build/client/libglyphwell-client.so.*" >/dev/null; then
    for file in usr/lib/$multiarch/libglyphwell-client.so.0 usr/include/glyphwell/client.h \
        usr/lib/$multiarch/pkgconfig/glyphwell-client.pc; do
        [ -e "$root/$file" ] || fail "/$file is missing"
    done
    grep -q '^libglyphwell-client 0 glyphwell ' "$tmp/control/shlibs" || fail "no shlibs entry"
    grep -qx 'activate-noawait ldconfig' "$tmp/control/triggers" || fail "no ldconfig trigger"
fi
recommends=$(sed -n 's/^Recommends: //p' "$tmp/control/control")
[ "$recommends" = "packagekit-gtk3-module, zenity" ] || fail "Recommends is \"$recommends\""
depends=$(sed -n 's/^Depends: //p' "$tmp/control/control")
echo "Depends: $depends"
for package in libc6 libqt6widgets6 libcurl4 libfontconfig1 qt6-qpa-plugins qt6-wayland; do
    [[ ", $depends," == *", $package"[\ ,]* ]] || fail "Depends lacks $package"
done

# The extracted tool finds a shared library of the package (the client library) in the root.
export LD_LIBRARY_PATH="$root/usr/lib/$multiarch"
agent_path=$(sed -n 's/^ExecStart=//p' "$root/usr/lib/systemd/user/glyphwell-ui-agent.service")
[ "$agent_path" = /usr/libexec/GlyphwellUIAgent ] || fail "ExecStart is $agent_path"
desktop="$root/usr/share/applications/$app_id.desktop"
grep -qx "Exec=$agent_path" "$desktop" || fail "the desktop entry does not start $agent_path"

# --- Unit files and desktop entry.
desktop-file-validate "$desktop" || fail "desktop-file-validate rejects the desktop entry"
for line in Name=Glyphwell NoDisplay=true Icon=$app_id; do
    grep -qx "$line" "$desktop" || fail "the desktop entry lacks $line"
done
missing_fonts="$root/usr/share/applications/org.glyphwell.Glyphwell.GetMissingFonts.desktop"
desktop-file-validate "$missing_fonts" || fail "desktop-file-validate rejects Get Missing Fonts"
grep -qx "Exec=/usr/bin/glyphwell fonts --ask --notify %F" "$missing_fonts" ||
    fail "Get Missing Fonts does not run /usr/bin/glyphwell fonts"
# systemd-analyze verify checks that ExecStart and the Documentation page exist: a copy of the
# service names the extracted agent, and the manual pages are looked up in the extracted root.
mkdir -p "$tmp/units" "$tmp/runtime" && chmod 700 "$tmp/runtime"
cp "$root/usr/lib/systemd/user/$unit" "$tmp/units/"
sed "s|^ExecStart=|ExecStart=$root|" "$root/usr/lib/systemd/user/glyphwell-ui-agent.service" \
    >"$tmp/units/glyphwell-ui-agent.service"
cp "$root/usr/lib/systemd/user/glyphwell-catalog-refresh.timer" "$tmp/units/"
sed "s|^ExecStart=|ExecStart=$root|" \
    "$root/usr/lib/systemd/user/glyphwell-catalog-refresh.service" \
    >"$tmp/units/glyphwell-catalog-refresh.service"
sed "s|^ExecStart=|ExecStart=$root|" "$root/usr/lib/systemd/user/glyphwell-bus-bridge.service" \
    >"$tmp/units/glyphwell-bus-bridge.service"
grep -qx 'Persistent=true' "$tmp/units/glyphwell-catalog-refresh.timer" ||
    fail "the catalog refresh timer does not catch up missed runs"
verify_status=0
XDG_RUNTIME_DIR="$tmp/runtime" MANPATH="$root/usr/share/man" systemd-analyze --user verify \
    "$tmp/units/$unit" "$tmp/units/glyphwell-ui-agent.service" \
    "$tmp/units/glyphwell-catalog-refresh.timer" "$tmp/units/glyphwell-catalog-refresh.service" \
    "$tmp/units/glyphwell-bus-bridge.service" >"$tmp/verify.log" 2>&1 ||
    verify_status=$?
if [ "$verify_status" != 0 ] && grep -q 'initialize manager' "$tmp/verify.log"; then
    echo "SKIP (systemd-analyze verify does not work here): $(head -1 "$tmp/verify.log")"
elif [ "$verify_status" != 0 ] || [ -s "$tmp/verify.log" ]; then
    # It reports most problems (an unknown key or value, a missing file) without failing.
    cat "$tmp/verify.log" >&2
    fail "systemd-analyze verify finds problems in the units"
else
    echo "systemd-analyze verify: the units are valid"
fi

# --- Manual page: no formatting warnings, and every verb and option of the usage text in it.
for page in man1/glyphwell.1.gz man8/GlyphwellUIAgent.8.gz man8/glyphwell-bus-bridge.8.gz; do
    MANWIDTH=80 man --warnings -E UTF-8 -l -Tutf8 -Z "$root/usr/share/man/$page" \
        2>"$tmp/man.err" >/dev/null || fail "man cannot format $page"
    [ ! -s "$tmp/man.err" ] || fail "$page: $(cat "$tmp/man.err")"
done
"$root/usr/bin/glyphwell" help >"$tmp/usage" || fail "glyphwell help failed"
zcat "$root/usr/share/man/man1/glyphwell.1.gz" | sed 's/\\-/-/g' >"$tmp/man.txt"
verbs=$(sed -n 's/^  \([a-z][a-z-]*\)\( .*\)\{0,1\}$/\1/p' "$tmp/usage")
[ -n "$verbs" ] || fail "no verbs found in the usage text"
for word in $verbs $(grep -oE -- '(^|[ [])-(-[a-z][a-z-]*|o)\b' "$tmp/usage" | tr -d ' [' | sort -u); do
    grep -qE -- "(^|[^a-z-])$word([^a-z-]|$)" "$tmp/man.txt" ||
        fail "glyphwell.1 does not describe $word"
done

# --- Maintainer scripts on the extracted root: the socket enabled on installation, masked on
# removal, enabled on reinstallation, an administrator's disable kept, nothing left after a purge.
link="$root/etc/systemd/user/sockets.target.wants/$unit"
mask="$root/etc/systemd/user/$unit"
unit_file="$root/usr/lib/systemd/user/$unit"
maintainer_step() { # EXPECT(enabled|masked|disabled) SCRIPT ARGUMENTS...
    local expect=$1 state=disabled
    shift
    DPKG_ROOT="$root" DPKG_MAINTSCRIPT_PACKAGE=glyphwell DPKG_MAINTSCRIPT_NAME=$1 \
        "$tmp/control/$1" "${@:2}" || fail "$* exited with $?"
    if [ "$(readlink "$mask")" = /dev/null ]; then
        state=masked
    elif [ "$(readlink "$link")" = "/usr/lib/systemd/user/$unit" ]; then
        state=enabled
    fi
    [ "$state" = "$expect" ] || fail "after $*: the socket is $state, expected $expect"
}
maintainer_step enabled postinst configure ""
mv "$unit_file" "$tmp/unit" # dpkg removes the files before postrm remove
maintainer_step masked postrm remove
mv "$tmp/unit" "$unit_file"
maintainer_step enabled postinst configure "$version"
rm "$link" # what `systemctl --global disable` does
maintainer_step disabled postinst configure "$version"
maintainer_step disabled postrm purge
# The package's own files in /etc (its conffiles) stay: they are dpkg's to remove on purge.
leftovers=$(find "$root/etc" "$root/var" -mindepth 1 ! -type d 2>/dev/null |
    sed "s|^$root||" | grep -vxF -f "$tmp/control/conffiles")
[ -z "$leftovers" ] || fail "left after purge: $leftovers"

# --- End to end: the extracted agent started by its socket, one request, idle exit.
"$source_dir/tests/e2e/socket-activation.sh" "$root$agent_path" "$root/usr/bin/glyphwell" ||
    fail "the extracted agent and tool do not work end to end"
echo "PASS"
