# Debian packages the project builds, tests and runs with; sourced by the scripts.
ZV_DEB_PACKAGES=(
  cmake g++ make pkg-config
  libefl-all-dev libedje-bin
  libcurl4-openssl-dev libxml2-dev libsqlite3-dev libglib2.0-dev
  libgtest-dev libgmock-dev
  libmicrohttpd-dev libssl-dev openssl
  gettext curl xvfb xauth matchbox-window-manager xdotool clang libclang-rt-14-dev
  libgstreamer1.0-dev gstreamer1.0-tools gstreamer1.0-plugins-base gstreamer1.0-plugins-good
  dbus-daemon iproute2
)

zv_install_deps() {
  local missing=() p
  for p in "${ZV_DEB_PACKAGES[@]}"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
  done
  [ ${#missing[@]} -eq 0 ] && return 0
  echo "installing: ${missing[*]}"
  local sudo=""
  [ "$(id -u)" -ne 0 ] && sudo=sudo
  $sudo apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq "${missing[@]}"
}
