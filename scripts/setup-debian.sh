#!/bin/sh
# Installs everything the build, the tests, the benchmarks and the tools need
# on a fresh Debian 12 machine.  Safe to run again.
set -eu
SUDO=""
if [ "$(id -u)" -ne 0 ]; then SUDO="sudo"; fi
$SUDO apt-get update
DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y --no-install-recommends \
  build-essential g++ cmake ninja-build binutils \
  googletest libgtest-dev libbenchmark-dev \
  g++-arm-linux-gnueabihf binutils-arm-linux-gnueabihf libc6-dev-armhf-cross \
  qemu-user \
  util-linux
