// kmctl auth: users' passwords, and the auth tokens that they yield.
#include <fmt/format.h>

#include <array>
#include <string>
#include <vector>

#include "client/kmctl/commands.h"
#include "client/kmctl/exit_codes.h"
#include "client/kmctl/files.h"
#include "client/kmctl/number_option.h"
#include "client/kmctl/output_file.h"
#include "client/kmctl/password.h"
#include "client/kmctl/token_output.h"
#include "client/kmctl/waiting.h"
#include "client/lib/authenticator.h"

namespace kmctl {
namespace {

namespace client = keymaster::client;

constexpr const char* enrol_examples =
    "The handle is what the TA knows the password by; it is of no use on another device. Without --password-file the\n"
    "password is asked for. With the present handle and password the user keeps the secure id, and with it the keys.\n"
    "The old handle goes on working until its file is deleted.\n\n"
    "Examples:\n"
    "  kmctl auth enrol --uid 1000 -o user.handle\n"
    "  kmctl auth enrol --uid 1000 --password-file secret.txt -o user.handle\n"
    "  kmctl auth enrol --uid 1000 --present-handle user.handle -o new.handle\n"
    "  kmctl generate --user-secure-id 1234567890 --user-auth-type password --auth-timeout 60 key.blob\n";

constexpr const char* token_examples =
    "After five wrong passwords in a row there is a wait, which doubles with each further one. It begins anew with "
    "each\n"
    "command, since the secure world starts with it: say --wait to sit it out.\n"
    "A token holds as long as the secure world runs, which ends with this command: kmctl sign and its like get the "
    "one\n"
    "that they need themselves. This one is to be looked at.\n\n"
    "Examples:\n"
    "  kmctl auth token --uid 1000 user.handle -o user.token\n"
    "  kmctl auth token --uid 1000 --password-file secret.txt --challenge 17 user.handle -o user.token\n";

std::string question(const char* kind, std::uint32_t uid) {
  return fmt::format("{} of user {}: ", kind, uid);
}

option add_uid(command_line& command, std::uint32_t& uid) {
  return add_number(command, "--uid", uid, "the user's number").required();
}

struct enrol_options {
  std::uint32_t uid = 0;
  password_option password;
  std::string present_handle;
  password_option present_password;
  waiting_option waiting;
  std::string out;
  bool force = false;
  option data_option;

  void add_to(command_line& command) {
    add_uid(command, uid);
    password.add_to(command, "--password-file", "file with the password, - for standard input (default: it is asked)");
    const option handle =
        command.add_option("--present-handle", present_handle, "the handle of the password that is to be replaced");
    handle.type_name("FILE");
    present_password.add_to(command, "--present-password-file", "file with that password (default: it is asked)")
        .needs(handle);
    waiting.add_to(command);
    data_option = command.add_option("-o,--output", out, "file for the handle, - for standard output");
    data_option.type_name("FILE").required();
    command.add_flag("--force", force, "overwrite an existing file");
    command.footer(enrol_examples);
  }
  [[nodiscard]] output_rules rules() const {
    return {.existing = force ? overwrite::always : overwrite::never, .mode = 0600};
  }
};

client::enrolment enrol(const enrol_options& options, const context& ctx) {
  const bytes handle =
      options.present_handle.empty() ? bytes{} : read_small_file(options.present_handle, "password handle");
  const secret_bytes old = options.present_handle.empty()
                               ? secret_bytes{}
                               : options.present_password.read(question("Present password", options.uid));
  const secret_bytes password = options.password.read_new(question("New password", options.uid));
  client::connection tee(tee_name(ctx));
  client::authenticator authenticator(tee);
  if (options.present_handle.empty()) {
    return authenticator.enrol(options.uid, password);
  }
  return options.waiting.around([&] {
    return authenticator.enrol(options.uid, password, client::present_password{.handle = handle, .password = old});
  });
}

int run_enrol(const enrol_options& options, const context& ctx) {
  const std::string& old_password = options.present_password.file();
  refuse_shared_input({&options.password.file(), &options.present_handle, &old_password});
  refuse_overwriting(options.out, {options.password.file(), options.present_handle, old_password});
  check_binary_output(options.out, options.rules());
  const client::enrolment enrolled = enrol(options, ctx);
  write_binary(options.out, enrolled.handle, options.rules());
  tell(ctx, fmt::format("User {} enrolled: secure id {}, handle in {}", options.uid, enrolled.secure_id, options.out),
       {{"uid", options.uid}, {"secure_id", enrolled.secure_id}, {"handle", options.out}});
  return exit_done;
}

struct token_options {
  std::uint32_t uid = 0;
  password_option password;
  std::string handle;
  std::uint64_t challenge = 0;
  waiting_option waiting;
  std::string out = "-";
  option data_option;

  void add_to(command_line& command) {
    add_uid(command, uid);
    password.add_to(command, "--password-file", "file with the password, - for standard input (default: it is asked)");
    command.add_option("HANDLE", handle, "the password's handle, - for standard input").required().type_name("");
    add_number(command, "--challenge", challenge, "the operation that the token is for (default: 0, none)");
    waiting.add_to(command);
    data_option = command.add_option("-o,--output", out, "file for the auth token (default: standard output)");
    data_option.type_name("FILE");
    command.footer(token_examples);
  }
};

int run_token(const token_options& options, const context& ctx) {
  refuse_shared_input({&options.password.file(), &options.handle});
  refuse_overwriting(options.out, {options.password.file(), options.handle});
  check_binary_output(options.out, token_rules);
  const bytes handle = read_small_file(options.handle, "password handle");
  const secret_bytes password = options.password.read(question("Password", options.uid));
  client::connection tee(tee_name(ctx));
  client::authenticator authenticator(tee);
  const bytes token =
      options.waiting.around([&] { return authenticator.verify(options.uid, options.challenge, handle, password); });
  write_binary(options.out, token, token_rules);
  const std::string text =
      fmt::format("Token of {} in {}: {}", format_size(token.size()), options.out, token_text(token));
  tell(ctx, options.out == "-" ? std::string{} : text, {{"output", options.out}, {"token", token_json(token)}});
  return exit_done;
}

constexpr std::array commands = std::to_array<command_row>({
    {"enrol", "Enrol a user's password, or change it", define<enrol_options, run_enrol>},
    {"token", "Turn a user's password into an auth token", define<token_options, run_token>},
});

}  // namespace

void define_auth(command_line& group, context& ctx) {
  define_group(group, ctx, commands);
}

}  // namespace kmctl
