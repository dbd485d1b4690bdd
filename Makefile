# Developer and CI entry points.
#   make test        install missing Debian packages, build (-Werror) and run every test
#   make test-asan   the same suite built with AddressSanitizer and UBSan
#   make test-tsan   the messaging engine's tests built with ThreadSanitizer
#   make demo        the system's main job end to end in a sandbox root (as root)
#   make bench       build and run the benchmarks
#   make install     install library, headers, CMake package and pkg-config file

BUILD      ?= build
ASAN_BUILD ?= build-asan
TSAN_BUILD ?= build-tsan
JOBS       ?= $(shell nproc 2>/dev/null || echo 2)
PREFIX     ?= /usr/local

DEB_PACKAGES = build-essential cmake pkg-config libgtest-dev libgmock-dev libbenchmark-dev \
               libjson-c-dev libssl-dev uuid-dev libcrypt-dev zlib1g-dev libfuse3-dev fuse3 \
               libcli11-dev btrfs-progs e2fsprogs util-linux libisns-dev open-isns-server open-isns-utils \
               iproute2

SUDO := $(shell [ "$$(id -u)" = 0 ] || echo sudo)

.PHONY: all deps configure build test test-asan test-tsan demo bench install clean

all: build

deps:
	@missing=""; for p in $(DEB_PACKAGES); do \
	  dpkg -s $$p >/dev/null 2>&1 || missing="$$missing $$p"; done; \
	if [ -n "$$missing" ]; then \
	  echo "Installing:$$missing"; \
	  $(SUDO) apt-get update -qq && \
	  DEBIAN_FRONTEND=noninteractive $(SUDO) apt-get install -y -qq --no-install-recommends $$missing; \
	fi

configure: deps
	cmake -S . -B $(BUILD) -DCMAKE_BUILD_TYPE=RelWithDebInfo

build: configure
	cmake --build $(BUILD) -j $(JOBS)

test: build
	cd $(BUILD) && ctest --output-on-failure -j $(JOBS) --timeout 900

test-asan: deps
	cmake -S . -B $(ASAN_BUILD) -DCMAKE_BUILD_TYPE=Debug -DORLO_SANITIZE=ON -DORLO_BUILD_BENCH=OFF
	cmake --build $(ASAN_BUILD) -j $(JOBS)
	cd $(ASAN_BUILD) && ASAN_OPTIONS=detect_leaks=1 UBSAN_OPTIONS=print_stacktrace=1 \
	  ctest --output-on-failure -j $(JOBS) --timeout 900

# The engine runs threads of its own; its tests (and the daemons they start, built alike)
# fail on any report: a daemon that reports exits non-zero and its test checks the status.
TSAN_FLAGS = -fsanitize=thread -fno-omit-frame-pointer -O1 -g
test-tsan: deps
	cmake -S . -B $(TSAN_BUILD) -DCMAKE_BUILD_TYPE=Debug -DORLO_BUILD_BENCH=OFF -DORLO_BUILD_SIM=OFF \
	  -DCMAKE_C_FLAGS="$(TSAN_FLAGS)" -DCMAKE_CXX_FLAGS="$(TSAN_FLAGS)" \
	  -DCMAKE_EXE_LINKER_FLAGS=-fsanitize=thread -DCMAKE_SHARED_LINKER_FLAGS=-fsanitize=thread
	cmake --build $(TSAN_BUILD) -j $(JOBS) --target test_comm
	cd $(TSAN_BUILD) && TSAN_OPTIONS="exitcode=66 second_deadlock_stack=1" \
	  ctest --output-on-failure -j $(JOBS) --timeout 900 -R '^Comm'

demo: build
	$(SUDO) tools/demo/orlo-demo.sh $(BUILD)/bin

bench: build
	@for b in $(BUILD)/bin/*_bench; do echo "== $$b"; $$b || exit 1; done

install: build
	cmake --install $(BUILD) --prefix $(PREFIX)

clean:
	rm -rf $(BUILD) $(ASAN_BUILD) $(TSAN_BUILD)
