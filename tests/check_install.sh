#!/usr/bin/env bash
# Installs the build into a scratch prefix and builds a consumer against it, once with
# pkg-config and once as a CMake package.
set -euo pipefail
build=$1 source=$2
prefix=$(mktemp -d /tmp/torvale-install.XXXXXX)
trap 'rm -rf "$prefix"' EXIT
cmake --install "$build" --prefix "$prefix" >/dev/null
for f in include/torvale/torvale.h share/torvale/schema.sql bin/torvale; do
  [ -e "$prefix/$f" ] || { echo "missing $f"; exit 1; }
done
libdir=$(dirname "$(find "$prefix" -name torvale.pc)")
export PKG_CONFIG_PATH=$libdir
c++ -std=c++17 -o "$prefix/consumer" "$source" $(pkg-config --cflags --libs torvale) -Wl,-rpath,"$prefix/lib"
"$prefix/consumer"

mkdir -p "$prefix/cmake-consumer"
cat > "$prefix/cmake-consumer/CMakeLists.txt" <<CM
cmake_minimum_required(VERSION 3.24)
project(consumer CXX)
find_package(torvale REQUIRED)
add_executable(consumer $source)
target_link_libraries(consumer PRIVATE torvale::torvale)
CM
cmake -S "$prefix/cmake-consumer" -B "$prefix/cmake-build" -DCMAKE_PREFIX_PATH="$prefix" >/dev/null
cmake --build "$prefix/cmake-build" >/dev/null
echo "pkg-config and CMake consumers built"
