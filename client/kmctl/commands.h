// The sub-commands of kmctl. Each function adds one to the command line and tells what it does when it is chosen.
#ifndef KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
#define KEYMASTER_CLIENT_KMCTL_COMMANDS_H_

#include <concepts>
#include <memory>
#include <span>

#include "client/kmctl/command_line.h"
#include "client/kmctl/context.h"

namespace kmctl {

// `ctx` outlives the sub-command; `command` comes with its name and its description.
void define_info(command_line& command, context& ctx);
void define_generate(command_line& command, context& ctx);
void define_import(command_line& command, context& ctx);
void define_export(command_line& command, context& ctx);
void define_characteristics(command_line& command, context& ctx);
void define_sign(command_line& command, context& ctx);
void define_verify(command_line& command, context& ctx);
void define_encrypt(command_line& command, context& ctx);
void define_decrypt(command_line& command, context& ctx);
void define_delete(command_line& command, context& ctx);
void define_delete_all(command_line& command, context& ctx);
void define_demo(command_line& command, context& ctx);

// Groups of sub-commands.
void define_device(command_line& group, context& ctx);
void define_attest(command_line& group, context& ctx);
void define_finger(command_line& group, context& ctx);
void define_auth(command_line& group, context& ctx);
void define_statement(command_line& group, context& ctx);
void define_tee(command_line& group, context& ctx);

/// A sub-command: its name, what it does in a few words, and the function that defines it.
struct command_row {
  const char* name;
  const char* description;
  void (*define)(command_line& command, context& ctx);
};

/// define_group adds sub-commands to the program itself or to a group; one of them must be chosen.
void define_group(command_line& group, context& ctx, std::span<const command_row> commands);

/// A command whose data may go to standard output tells by which option.
template <class Options>
concept has_data_option = requires(const Options& options) {
  { (options.data_option) } -> std::same_as<const option&>;
};

/// And one that writes data only when it is asked to.
template <class Options>
concept has_extra_data_option = requires(const Options& options) {
  { (options.extra_data_option) } -> std::same_as<const option&>;
};

/// goes_to_stdout tells what the command line says of an output, whether it makes sense on the whole or not.
[[nodiscard]] inline bool goes_to_stdout(const option& output) {
  return output.is_given() ? output.value() == "-" : !output.is_required();
}
[[nodiscard]] inline bool extra_goes_to_stdout(const option& output) {
  return output.is_given() && output.value() == "-";
}

/// define attaches a command's options and its work. `Options` collects what the command line says, in its
/// `add_to(command_line&)`, and as `data_option` where its data goes; `run` does the work and gives the exit code.
template <class Options>
void define(command_line& command, context& ctx, int (*run)(const Options&, const context&)) {
  const auto options = std::make_shared<Options>();
  options->add_to(command);
  if constexpr (has_data_option<Options>) {
    command.when_met(
        [options, &ctx] { ctx.data_on_stdout = [options] { return goes_to_stdout(options->data_option); }; });
  }
  if constexpr (has_extra_data_option<Options>) {
    command.when_met([options, &ctx] {
      ctx.data_on_stdout = [options] { return extra_goes_to_stdout(options->extra_data_option); };
    });
  }
  command.when_read([options, &ctx, run] { ctx.exit = run(*options, ctx); });
}

/// The same as a function that a command_row can name.
template <class Options, int (*run)(const Options&, const context&)>
void define(command_line& command, context& ctx) {
  define<Options>(command, ctx, run);
}

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
