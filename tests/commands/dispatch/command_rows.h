// The commands as the protocol lists them.
#ifndef TESTS_COMMANDS_DISPATCH_COMMAND_ROWS_H_
#define TESTS_COMMANDS_DISPATCH_COMMAND_ROWS_H_

#include <array>

#include "tests/commands/raw_session.h"

namespace testing_support {

struct command_row {
  std::uint32_t id;
  const char* name;
  std::uint32_t types;
  bool a_is_zero, b_is_zero;  // what slot 0 must hold on entry
};

inline constexpr std::array<command_row, 28> command_rows = {{
    {1, "get_support_algo_cnt", values_only, true, true},
    {2, "get_support_algo", with_response, true, true},
    {3, "get_support_blk_mode_cnt", values_only, false, false},
    {4, "get_support_blk_mode", with_response, false, false},
    {5, "get_support_padding_mode_cnt", values_only, false, false},
    {6, "get_support_padding_mode", with_response, false, false},
    {7, "get_support_digest_cnt", values_only, false, false},
    {8, "get_support_digest", with_response, false, false},
    {9, "get_support_import_format_cnt", values_only, false, true},
    {10, "get_support_import_format", with_response, false, true},
    {11, "get_support_export_format_cnt", values_only, false, true},
    {12, "get_support_export_format", with_response, false, true},
    {13, "generate_key", with_both, true, true},
    {14, "get_key_character_size", with_request, true, true},
    {15, "get_key_character", with_both, true, true},
    {16, "begin", with_both, false, true},
    {17, "update", with_both, false, true},
    {18, "finish", with_both, false, true},
    {19, "import_key", with_both, true, true},
    {20, "export_key", with_both, true, true},
    {21, "delete_key", with_request, true, true},
    {22, "delete_all_key", values_only, true, true},
    {23, "_abort", values_only, false, true},
    {0xFF00, "soter_handle_generate_attk_key_pair", values_only, false, true},
    {0xFF01, "soter_handle_verify_attk_key_pair", values_only, true, true},
    {0xFF02, "soter_handle_export_attk_public_key", status_and_response, true, true},
    {0xFF03, "soter_handle_get_device_id", status_and_response, true, true},
    {0xFF04, "soter_handle_setFid", request_only, false, false},
}};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_DISPATCH_COMMAND_ROWS_H_
