# Entry points for people and CI. Every target installs what is missing first.
BUILD ?= build
ASAN_BUILD ?= build-asan
JOBS ?= $(shell nproc)
CMAKE_FLAGS ?=

.PHONY: setup build demo test test-asan clean

setup:
	scripts/setup

build: setup
	cmake -S . -B $(BUILD) -G Ninja $(CMAKE_FLAGS)
	cmake --build $(BUILD) -j $(JOBS)

# The main job on a bundled sample: an Exchange 2007 mailbox database the
# test store builder generates at build time, scanned, its Inbox listed,
# and every folder exported to EML files below build/demo-export and to a
# PST file in build/demo-pst.
demo: build
	$(BUILD)/cli/tarnwell info $(BUILD)/samples/exchange2007.edb
	$(BUILD)/cli/tarnwell scan $(BUILD)/samples/exchange2007.edb
	$(BUILD)/cli/tarnwell list $(BUILD)/samples/exchange2007.edb --folder 1000000000a31
	mkdir -p $(BUILD)/demo-export
	$(BUILD)/cli/tarnwell export $(BUILD)/samples/exchange2007.edb --to eml --hierarchy \
	    --out $(BUILD)/demo-export --log-dir $(BUILD)/demo-export
	rm -rf $(BUILD)/demo-pst && mkdir -p $(BUILD)/demo-pst
	$(BUILD)/cli/tarnwell export $(BUILD)/samples/exchange2007.edb --to pst \
	    --out $(BUILD)/demo-pst --log-dir $(BUILD)/demo-pst

test: build
	ctest --test-dir $(BUILD) --output-on-failure -j $(JOBS)

# The same tests under AddressSanitizer and UndefinedBehaviorSanitizer.
test-asan: setup
	cmake -S . -B $(ASAN_BUILD) -G Ninja -DTARNWELL_SANITIZE=ON -DCMAKE_BUILD_TYPE=Debug $(CMAKE_FLAGS)
	cmake --build $(ASAN_BUILD) -j $(JOBS)
	ctest --test-dir $(ASAN_BUILD) --output-on-failure -j $(JOBS)

clean:
	rm -rf $(BUILD) $(ASAN_BUILD)
