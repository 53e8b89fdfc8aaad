// The sub-commands of kmctl. Each function adds one to the command line and tells what it does when it is chosen.
#ifndef KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
#define KEYMASTER_CLIENT_KMCTL_COMMANDS_H_

#include <CLI/CLI.hpp>
#include <concepts>
#include <memory>

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

/// A command whose data may go to standard output tells by which option.
template <class Options>
concept has_data_option = requires(const Options& options) {
  { *options.data_option } -> std::same_as<CLI::Option&>;
};

/// goes_to_stdout tells what the command line says of an output, whether it makes sense on the whole or not.
[[nodiscard]] inline bool goes_to_stdout(const CLI::Option& output) {
  return output.empty() ? !output.get_required() : output.results().back() == "-";
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
  command.final_callback([options, &ctx, run] { ctx.exit = run(*options, ctx); });
}

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
