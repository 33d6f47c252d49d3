// SPDX-License-Identifier: Apache-2.0
// How the page looks, on light and on dark screens and on paper.
//
// The page allows this style and no other: by its hash, so that nothing that a client told can become a style.
#pragma once

#include <string_view>

// SHA-256 of the style in Base64, which the test of the page computes anew.
constexpr std::string_view pageStyleHash = "dFshMGW5OqMM5bkPOcfTcuX4oS8sLiG08qmMPgnnuFU=";

[[nodiscard]] std::string_view pageStyle();
