// The sub-commands of kmctl. Each function adds one to the command line and tells what it does when it is chosen.
#ifndef KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
#define KEYMASTER_CLIENT_KMCTL_COMMANDS_H_

#include <CLI/CLI.hpp>
#include <concepts>
#include <memory>
#include <span>

#include "client/kmctl/context.h"

namespace kmctl {

// `ctx` outlives the sub-command; `command` comes with its name and its description.
void define_info(CLI::App& command, context& ctx);
void define_generate(CLI::App& command, context& ctx);
void define_import(CLI::App& command, context& ctx);
void define_export(CLI::App& command, context& ctx);
void define_characteristics(CLI::App& command, context& ctx);
void define_sign(CLI::App& command, context& ctx);
void define_verify(CLI::App& command, context& ctx);
void define_encrypt(CLI::App& command, context& ctx);
void define_decrypt(CLI::App& command, context& ctx);
void define_delete(CLI::App& command, context& ctx);
void define_delete_all(CLI::App& command, context& ctx);
void define_demo(CLI::App& command, context& ctx);

// Groups of sub-commands.
void define_device(CLI::App& group, context& ctx);
void define_attest(CLI::App& group, context& ctx);
void define_finger(CLI::App& group, context& ctx);
void define_auth(CLI::App& group, context& ctx);
void define_statement(CLI::App& group, context& ctx);
void define_tee(CLI::App& group, context& ctx);

/// A sub-command: its name, what it does in a few words, and the function that defines it.
struct command_row {
  const char* name;
  const char* description;
  void (*define)(CLI::App& command, context& ctx);
};

/// define_group adds sub-commands to the program itself or to a group; one of them must be chosen.
void define_group(CLI::App& group, context& ctx, std::span<const command_row> commands);

/// A command whose data may go to standard output tells by which option.
template <class Options>
concept has_data_option = requires(const Options& options) {
  { *options.data_option } -> std::same_as<CLI::Option&>;
};

/// And one that writes data only when it is asked to.
template <class Options>
concept has_extra_data_option = requires(const Options& options) {
  { *options.extra_data_option } -> std::same_as<CLI::Option&>;
};

/// goes_to_stdout tells what the command line says of an output, whether it makes sense on the whole or not.
[[nodiscard]] inline bool goes_to_stdout(const CLI::Option& output) {
  return output.empty() ? !output.get_required() : output.results().back() == "-";
}
[[nodiscard]] inline bool extra_goes_to_stdout(const CLI::Option& output) {
  return !output.empty() && output.results().back() == "-";
}

/// define attaches a command's options and its work. `Options` collects what the command line says, in its
/// `add_to(CLI::App&)`, and as `data_option` where its data goes; `run` does the work and gives the exit code.
template <class Options>
void define(CLI::App& command, context& ctx, int (*run)(const Options&, const context&)) {
  const auto options = std::make_shared<Options>();
  options->add_to(command);
  if constexpr (has_data_option<Options>) {
    command.preparse_callback([options, &ctx](std::size_t /*arguments*/) {
      ctx.data_on_stdout = [options] { return goes_to_stdout(*options->data_option); };
    });
  }
  if constexpr (has_extra_data_option<Options>) {
    command.preparse_callback([options, &ctx](std::size_t /*arguments*/) {
      ctx.data_on_stdout = [options] { return extra_goes_to_stdout(*options->extra_data_option); };
    });
  }
  command.final_callback([options, &ctx, run] { ctx.exit = run(*options, ctx); });
}

/// The same as a function that a command_row can name.
template <class Options, int (*run)(const Options&, const context&)>
void define(CLI::App& command, context& ctx) {
  define<Options>(command, ctx, run);
}

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
