#include "support/statistics/linux/openmetrics_text.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <string_view>

namespace spacekeep {
namespace {

using Labels = std::vector<prometheus::ClientMetric::Label>;

std::string escaped(std::string_view text) {
  std::string out;
  for (const char character : text) {
    if (character == '\\' || character == '"') out += '\\';
    if (character == '\n') {
      out += "\\n";
    } else {
      out += character;
    }
  }
  return out;
}

std::string numberText(double number) {
  if (std::isnan(number)) return "NaN";
  if (std::isinf(number)) return number > 0 ? "+Inf" : "-Inf";
  char digits[40];
  const auto end = std::to_chars(digits, digits + sizeof(digits), number).ptr;
  return std::string(digits, end);
}

void addSample(std::string& out, const std::string& name, const Labels& labels,
               const std::string& value) {
  out += name;
  const char* separator = "{";
  for (const auto& label : labels) {
    out += separator + label.name + "=\"" + escaped(label.value) + '"';
    separator = ",";
  }
  if (!labels.empty()) out += '}';
  out += ' ' + value + '\n';
}

// Bounds are written as the format wants floating numbers: 1000 as 1000.0.
std::string boundText(double bound) {
  const std::string text = numberText(bound);
  return text.find_first_of(".eNI") == std::string::npos ? text + ".0" : text;
}

void addHistogram(std::string& out, const std::string& name,
                  const prometheus::ClientMetric& metric) {
  for (const auto& bucket : metric.histogram.bucket) {
    Labels labels = metric.label;
    labels.push_back({"le", boundText(bucket.upper_bound)});
    addSample(out, name + "_bucket", labels, std::to_string(bucket.cumulative_count));
  }
  addSample(out, name + "_count", metric.label, std::to_string(metric.histogram.sample_count));
  addSample(out, name + "_sum", metric.label, numberText(metric.histogram.sample_sum));
}

void addFamily(std::string& out, const prometheus::MetricFamily& family) {
  const bool counter = family.type == prometheus::MetricType::Counter;
  if (!counter && family.type != prometheus::MetricType::Histogram) return;
  out += "# TYPE " + family.name + (counter ? " counter\n" : " histogram\n");
  out += "# HELP " + family.name + ' ' + escaped(family.help) + '\n';
  // The registry gives them in the order of a hash; files that say the same shall look the same.
  std::vector<prometheus::ClientMetric> metrics = family.metric;
  std::sort(metrics.begin(), metrics.end(),
            [](const auto& left, const auto& right) { return left.label < right.label; });
  for (const auto& metric : metrics) {
    if (counter) {
      addSample(out, family.name + "_total", metric.label, numberText(metric.counter.value));
    } else {
      addHistogram(out, family.name, metric);
    }
  }
}

}  // namespace

std::string openMetricsText(const std::vector<prometheus::MetricFamily>& families) {
  std::string out;
  for (const auto& family : families) addFamily(out, family);
  return out + "# EOF\n";
}

}  // namespace spacekeep
