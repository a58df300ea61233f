#!/usr/bin/env python3
"""Tests of check-includes on made-up trees."""
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

PROGRAM = Path(__file__).resolve().parent / "check-includes"


class CheckIncludesTest(unittest.TestCase):
    def check(self, files):
        """Runs the program on a tree of {path: text}; answers its exit status and its lines."""
        with tempfile.TemporaryDirectory() as folder:
            for path, text in files.items():
                file = Path(folder) / path
                file.parent.mkdir(parents=True, exist_ok=True)
                file.write_text(text, encoding="utf-8")
            done = subprocess.run([sys.executable, PROGRAM, folder], capture_output=True, text=True, check=False)
            self.assertEqual(done.stderr, "")
            return done.returncode, done.stdout.splitlines()

    def assert_clean(self, files):
        self.assertEqual(self.check(files), (0, ["The includes follow the layering"]))

    def assert_faults(self, files, *lines):
        self.assertEqual(self.check(files), (1, list(lines)))

    def test_an_empty_tree_is_clean(self):
        self.assert_clean({})

    def test_arrows_that_point_down_are_clean(self):
        self.assert_clean({
            "common/values/Value.h": "#include <string>\n",
            "platform/Log.h": '#include "common/values/Value.h"\n',
            "common/Settings.h": '#include "platform/Log.h"\n#include "common/values/Value.h"\n',
            "tracing/Trace.h": '#include "common/Settings.h"\n',
            "session/Session.h": '#include "tracing/Trace.h"\n',
            "service/Delegate.h": '#include "session/Session.h"\n',
            "platform/plist/Reader.cpp": '#include "common/Settings.h"\n#include <plist/plist.h>\n#include <unistd.h>\n',
            "app/main.cpp": '#include "service/Delegate.h"\n#include "platform/plist/Reader.h"\n',
            "platform/plist/Reader.h": "",
        })

    def test_the_client_library_may_use_the_system_and_its_own_installed_headers(self):
        self.assert_clean({
            "client/Link.cpp": "#include <poll.h>\n#include <sys/socket.h>\n#include <vela/reporting.h>\n",
            "client/include/vela/reporting.h": "#include <stdint.h>\n",
        })
        self.assert_faults({
            "client/Link.cpp": "#include <plist/plist.h>\n",
        }, "client/Link.cpp:1: client/ includes standard and project headers only, not <plist/plist.h>")

    def test_values_include_nothing_but_themselves(self):
        self.assert_faults({
            "platform/Log.h": "",
            "common/values/Value.h": '#include <string>\n\n#include "platform/Log.h"\n',
        }, "common/values/Value.h:3: common/values/ may not include platform/")

    def test_interfaces_do_not_include_common(self):
        self.assert_faults({
            "common/Settings.h": "",
            "platform/Log.h": '#include "common/Settings.h"\n',
        }, "platform/Log.h:1: platform/ may not include common/")

    def test_a_room_does_not_include_a_room_above_it(self):
        self.assert_faults({
            "service/Delegate.h": "",
            "session/Session.cpp": '#include "service/Delegate.h"\n',
        }, "session/Session.cpp:1: session/ may not include service/")

    def test_the_core_does_not_include_a_binding(self):
        self.assert_faults({
            "platform/linux/Files.h": "",
            "service/Delegate.cpp": '#include "platform/linux/Files.h"\n',
        }, "service/Delegate.cpp:1: service/ may not include platform/linux/")

    def test_a_binding_does_not_include_another_binding(self):
        self.assert_faults({
            "platform/linux/Files.h": "",
            "platform/plist/Reader.cpp": '#include "platform/linux/Files.h"\n',
        }, "platform/plist/Reader.cpp:1: platform/plist/ may not include platform/linux/")

    def test_the_command_line_client_does_not_include_the_service(self):
        self.assert_faults({
            "service/Delegate.h": "",
            "cli/main.cpp": '#include "service/Delegate.h"\n',
        }, "cli/main.cpp:1: cli/ may not include service/")

    def test_a_library_stays_in_its_binding(self):
        self.assert_faults({
            "common/Reader.cpp": "#include <plist/plist.h>\n",
            "platform/toml/Reader.cpp": "#include <plist/plist.h>\n",
        }, "common/Reader.cpp:1: common/ includes standard and project headers only, not <plist/plist.h>",
            "platform/toml/Reader.cpp:1: <plist/plist.h> belongs neither to platform/toml/'s library nor to the operating "
            "system's headers")

    def test_operating_system_headers_stay_in_bindings(self):
        self.assert_faults({"app/main.cpp": "#include <unistd.h>\n"},
                           "app/main.cpp:1: app/ includes standard and project headers only, not <unistd.h>")

    def test_the_command_line_client_may_use_a_library(self):
        self.assert_clean({"cli/Table.cpp": "#include <some/library.h>\n#include <unistd.h>\n"})

    def test_product_files_never_include_fakes(self):
        self.assert_faults({
            "testing/FakeClock.h": "",
            "common/Settings.cpp": '#include "testing/FakeClock.h"\n',
            "app/main.cpp": '#include "testing/FakeClock.h"\n',
        }, "app/main.cpp:1: product files never include testing/", "common/Settings.cpp:1: product files never include testing/")

    def test_tests_and_benchmarks_include_fakes_and_libraries(self):
        self.assert_clean({
            "testing/FakeClock.h": "#include <gtest/gtest.h>\n",
            "common/Settings_test.cpp": '#include "testing/FakeClock.h"\n#include <nlohmann/json.hpp>\n',
            "common/Settings_benchmark.cpp": '#include "testing/FakeClock.h"\n#include <benchmark/benchmark.h>\n',
            "benchmarks/Values_benchmark.cpp": '#include "testing/FakeClock.h"\n',
        })

    def test_a_test_is_bound_to_the_layering_of_its_room(self):
        self.assert_faults({
            "platform/linux/Files.h": "",
            "common/Settings_test.cpp": '#include "platform/linux/Files.h"\n',
        }, "common/Settings_test.cpp:1: common/ may not include platform/linux/")

    def test_an_integration_test_may_include_everything(self):
        self.assert_clean({
            "platform/linux/Files.h": "",
            "service/Delegate_integrationtest.cpp": '#include "platform/linux/Files.h"\n',
        })

    def test_a_header_that_is_not_named_from_the_root_is_a_fault(self):
        reason = "is no file of a room; project headers are named from the root, others stand in <>"
        self.assert_faults({
            "common/Settings.h": "",
            "common/Settings.cpp": '#include "Settings.h"\n#include "../common/Settings.h"\n#include "common/Absent.h"\n',
        }, f'common/Settings.cpp:1: "Settings.h" {reason}', f'common/Settings.cpp:2: "../common/Settings.h" {reason}',
            f'common/Settings.cpp:3: "common/Absent.h" {reason}')

    def test_an_include_of_a_macro_is_a_fault(self):
        self.assert_faults({"common/Settings.cpp": "#  include VELA_HEADER\n"},
                           "common/Settings.cpp:1: an include must name its file, not a macro")

    def test_a_file_outside_all_rooms_is_a_fault(self):
        self.assert_faults({"attic/Old.cpp": ""}, "attic/Old.cpp:1: no room of the table holds this file")

    def test_rooms_that_include_each_other_are_reported(self):
        self.assert_faults({
            "common/Settings.h": '#include "platform/Log.h"\n',
            "platform/Log.h": '#include "common/Settings.h"\n',
        }, "platform/Log.h:1: platform/ may not include common/",
            "common/Settings.h:1: rooms include each other in a circle: common -> platform -> common")

    def test_a_circle_through_tests_is_none(self):
        self.assert_clean({
            "platform/Log.h": "",
            "platform/Log_test.cpp": '#include "testing/FakeLog.h"\n',
            "testing/FakeLog.h": '#include "platform/Log.h"\n',
        })

    def test_build_folders_are_not_read(self):
        self.assert_clean({"build/debug/x.cpp": "#include <plist/plist.h>\n", ".cache/x.cpp": "#include <zlib.h>\n"})

    def test_an_include_in_a_comment_is_none(self):
        self.assert_clean({"common/Settings.cpp": "// #include <plist/plist.h>\n"})


if __name__ == "__main__":
    unittest.main()
