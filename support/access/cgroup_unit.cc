#include "support/access/cgroup_unit.h"

namespace spacekeep::access {
namespace {

constexpr std::string_view kUnifiedPrefix = "0::/";  // hierarchy 0 without controllers: cgroup v2
constexpr std::string_view kServiceSuffix = ".service";
constexpr std::size_t kMaxUnitName = 255;

/// The path in the unified hierarchy without its leading slash, none when there is none.
std::optional<std::string_view> unifiedPath(std::string_view text) {
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    const std::string_view line = text.substr(0, end);
    if (line.starts_with(kUnifiedPrefix)) return line.substr(kUnifiedPrefix.size());
    if (end == std::string_view::npos) break;
    text.remove_prefix(end + 1);
  }
  return std::nullopt;
}

/// systemd puts "_" before names that would collide with the kernel's own files.
std::string_view unescaped(std::string_view component) {
  if (component.starts_with('_')) component.remove_prefix(1);
  return component;
}

}  // namespace

bool tellsUnit(std::string_view cgroup_text) {
  const auto path = unifiedPath(cgroup_text);
  return path && path->substr(0, path->find('/')) != "..";
}

std::optional<std::string> systemUnitFromCgroup(std::string_view cgroup_text) {
  auto path = unifiedPath(cgroup_text);
  while (path && !path->empty()) {
    const std::size_t end = path->find('/');
    const std::string_view component = unescaped(path->substr(0, end));
    if (!component.ends_with(".slice")) {
      const bool is_service = component.ends_with(kServiceSuffix) &&
                              component.size() > kServiceSuffix.size() &&
                              component.size() <= kMaxUnitName;
      if (!is_service) return std::nullopt;
      return std::string(component);
    }
    if (end == std::string_view::npos) break;
    path->remove_prefix(end + 1);
  }
  return std::nullopt;
}

}  // namespace spacekeep::access
