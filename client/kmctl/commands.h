// The sub-commands of kmctl. Each function adds one to the command line and tells what it does when it is chosen.
#ifndef KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
#define KEYMASTER_CLIENT_KMCTL_COMMANDS_H_

#include <CLI/CLI.hpp>
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
void define_delete(CLI::App& command, context& ctx);
void define_delete_all(CLI::App& command, context& ctx);
void define_demo(CLI::App& command, context& ctx);

/// define attaches a command's options and its work. `Options` collects what the command line says, in its
/// `add_to(CLI::App&)`; `run` does the work and gives the exit code.
template <class Options>
void define(CLI::App& command, context& ctx, int (*run)(const Options&, const context&)) {
  const auto options = std::make_shared<Options>();
  options->add_to(command);
  command.final_callback([options, &ctx, run] { ctx.exit = run(*options, ctx); });
}

}  // namespace kmctl

#endif  // KEYMASTER_CLIENT_KMCTL_COMMANDS_H_
