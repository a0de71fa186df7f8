#!/usr/bin/env bash
# The installation as a robot integrator uses it: installs the build into a fresh prefix,
# builds examples/hello-module against that prefix as a project of its own, starts the
# installed `zefoko serve` listening with libzumokuto.so and the module, speaks a text with
# the installed `mokuto`, and calls the module with the installed Python client.
#
# Everything after the installation runs with the source and build trees out of reach:
# - in a mount namespace of its own where an empty read-only tmpfs covers each tree, when
#   the test may make one (root with CAP_SYS_ADMIN), so that nothing of them can be read;
# - under strace, which lists every path that CMake, the compiler, the installed programs
#   and the Python client name: any path inside a tree fails the test, whether the tree
#   is hidden or not.
# At least one of the two is required; both are used where both work. The programs run in
# a directory outside the trees, so that no relative path reaches them either.
#
# Usage: install_test.sh SOURCE_DIR BUILD_DIR [COMPILER_LAUNCHER]
set -euo pipefail

source_dir="$(realpath "$1")"
build_dir="$(realpath "$2")"
launcher="${3:-}"
python=/usr/bin/python3  # Debian's, with python3-zmq and python3-msgpack

fail() {
  echo "install test: $*" >&2
  exit 1
}

if [[ "${INSTALL_TEST_STAGE:-}" != inside ]]; then
  # One work directory per build tree, so that runs of several trees do not meet and
  # ccache finds the module's compilation of the previous run.
  work="/tmp/zefoko-install-test-$(printf %s "$build_dir" | md5sum | cut -c1-12)"
  rm -rf "$work"
  mkdir -p "$work/trace"
  cmake --install "$build_dir" --prefix "$work/prefix" --component Runtime >/dev/null
  cmake --install "$build_dir" --prefix "$work/prefix" --component Development >/dev/null
  cp -r "$source_dir/examples/hello-module" "$work/hello-module"
  cp "$0" "$work/install_test.sh"
  cd "$work"
  export INSTALL_TEST_STAGE=inside INSTALL_TEST_WORK="$work" INSTALL_TEST_HIDE=no
  if unshare --mount --propagation private true 2>/dev/null; then
    INSTALL_TEST_HIDE=yes exec unshare --mount --propagation private \
      bash "$work/install_test.sh" "$@"
  fi
  exec bash "$work/install_test.sh" "$@"
fi

work="$INSTALL_TEST_WORK"
prefix="$work/prefix"
cd "$work"

trees=("$source_dir" "$build_dir")
if [[ "$INSTALL_TEST_HIDE" == yes ]]; then
  # The deeper tree first: the build tree is usually inside the source tree.
  while read -r tree; do
    [[ -d "$tree" ]] && mount -t tmpfs -o ro,size=4k,mode=0755 none "$tree"
  done < <(printf '%s\n' "${trees[@]}" | awk '{ print length, $0 }' | sort -rn | cut -d' ' -f2-)
  [[ -z "$(ls -A "$source_dir")" ]] || fail "the source tree is still visible"
fi
traced=no
if strace -f -qq -o /dev/null true 2>/dev/null; then
  traced=yes
fi
if [[ "$INSTALL_TEST_HIDE" != yes && "$traced" != yes ]]; then
  # A container without CAP_SYS_ADMIN and ptrace: the test cannot prove anything here.
  echo "install test: skipped: neither a mount namespace (unshare) nor strace is available, so the trees cannot be kept out of reach"
  exit 0
fi

# run NAME COMMAND...: COMMAND under strace when it works, its output in NAME.log.
run() {
  local name="$1"
  shift
  if [[ "$traced" == yes ]]; then
    strace -f -qq --seccomp-bpf -e trace=%file -e signal=none -o "trace/$name" "$@" >"$name.log" 2>&1
  else
    "$@" >"$name.log" 2>&1
  fi
}
expect() {  # NAME PATTERN: the log of NAME has a line that matches PATTERN
  grep -qE -- "$2" "$1.log" || { cat "$1.log" >&2; fail "$1: no line matches '$2'"; }
}

run configure cmake -S hello-module -B hello-build -G Ninja -DCMAKE_PREFIX_PATH="$prefix" \
  -DCMAKE_FIND_USE_PACKAGE_REGISTRY=OFF ${launcher:+-DCMAKE_CXX_COMPILER_LAUNCHER="$launcher"} ||
  { cat configure.log >&2; fail "the module's project does not configure against the prefix"; }
run build cmake --build hello-build || { cat build.log >&2; fail "the module does not build"; }

endpoint="ipc://$work/robot"
if [[ "$traced" == yes ]]; then
  strace -f -qq --seccomp-bpf -e trace=%file -e signal=none -o trace/serve \
    "$prefix/bin/zefoko" serve --listen "$endpoint" --speech timing --fast \
    "$prefix/lib/zefoko/libzumokuto.so" hello-build/libhello.so >serve.log 2>&1 &
else
  "$prefix/bin/zefoko" serve --listen "$endpoint" --speech timing --fast \
    "$prefix/lib/zefoko/libzumokuto.so" hello-build/libhello.so >serve.log 2>&1 &
fi
launched=$!
stop_serve() {
  # The zefoko process itself: strace's child when traced.
  local pid="$launched"
  if [[ "$traced" == yes ]]; then
    pid="$(cat "/proc/$launched/task/$launched/children" 2>/dev/null | awk '{ print $1 }')"
  fi
  [[ -n "$pid" ]] && kill -TERM "$pid" 2>/dev/null || true
  wait "$launched" || true
}
trap stop_serve EXIT
for ((i = 0; i < 600; ++i)); do  # a bound of 60 s
  grep -qs "zefoko serve: serving" serve.log && break
  kill -0 "$launched" 2>/dev/null || { cat serve.log >&2; fail "zefoko serve ended"; }
  sleep 0.1
done
expect serve "loaded .*libzumokuto.so ZUMokuto"
expect serve "loaded .*libhello.so Hello"
expect serve "zefoko serve: serving"

# A text in the default (contextual) mode: the linguistic databases give the automatic
# gesture, the animation library the started behaviour, the sound sets the sound.
run say "$prefix/bin/mokuto" --connect "$endpoint" say \
  'Hello ^start(animations/Stand/Gestures/Hey_1) my friend ^runSound(bells/ding, 50) see you' ||
  { cat say.log >&2; fail "mokuto say failed"; }
expect say "AUTO_START_TAG\(hello\) +executed"
expect say "\^start\(animations/Stand/Gestures/Hey_1\) +executed"
expect say "\^runSound\(bells/ding, 50\) +executed"
expect say "end of text 1 \(ZUMokuto/EndOfMokuto\)"

# The service in mokuto's own process: its framework finds the prefix's French database.
run say_here "$prefix/bin/mokuto" say --speech timing --fast --language French \
  'Bonjour ^runSound(bells/ding, 50) mes amis' || { cat say_here.log >&2; fail "mokuto say failed"; }
expect say_here "AUTO_START_TAG\(bonjour\) +executed"
expect say_here "\^runSound\(bells/ding, 50\) +executed"

run client env PYTHONPATH="$prefix/lib/python3/dist-packages" "$python" \
  hello-module/hello.py "$endpoint" Ada || { cat client.log >&2; fail "the Python client failed"; }
expect client "^Hello, Ada!$"
expect client "^greetings: 2$"

stop_serve
trap - EXIT
expect serve "zefoko serve: stopped"

if [[ "$traced" == yes ]]; then
  for tree in "${trees[@]}"; do
    if grep -F -e "\"$tree/" -e "\"$tree\"" trace/*; then
      fail "a path of the tree $tree was named (above)"
    fi
  done
fi
echo "install test: passed; trees hidden: $INSTALL_TEST_HIDE, paths traced: $traced ($(cat trace/* 2>/dev/null | wc -l) file calls)"
rm -rf "$work"
