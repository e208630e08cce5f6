// The module's name: its registration name and the component of its log lines.
#pragma once

constexpr char kModuleName[] = "morvanek";
