#!/usr/bin/env bash
# Installs, from Debian's archive, whatever the project needs and the machine
# lacks. Safe to run again: it installs nothing when everything is present.
set -euo pipefail

packages=(
    g++ cmake make pkgconf
    libopencv-core-dev libopencv-imgproc-dev libopencv-dnn-dev libopencv-imgcodecs-dev
    libopencv-objdetect-dev opencv-data
    libtbb-dev libgtest-dev libgmock-dev libbenchmark-dev zlib1g-dev
    nlohmann-json3-dev libdlib-dev
    clang-14 libclang-rt-14-dev
    liblcms2-dev libexiv2-dev
    # The tests' references: Little CMS's converters, free ICC profiles, and
    # ffmpeg as an outside reader of the exported .cube.
    liblcms2-utils icc-profiles-free ffmpeg
)

missing=()
for p in "${packages[@]}"; do
    if [ "$(dpkg-query -W -f='${Status}' "$p" 2>/dev/null || true)" != "install ok installed" ]; then
        missing+=("$p")
    fi
done

if [ ${#missing[@]} -eq 0 ]; then
    exit 0
fi

echo "Installing: ${missing[*]}"
sudo=""
if [ "$(id -u)" -ne 0 ]; then sudo="sudo"; fi
export DEBIAN_FRONTEND=noninteractive
$sudo apt-get update -qq
$sudo apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
