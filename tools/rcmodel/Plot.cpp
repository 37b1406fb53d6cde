// SPDX-License-Identifier: MIT
// rcmodel plot: a model drawn as an SVG picture: the OCV grid, then one panel
// per resistance table of the record with its values at 25 °C and its
// temperature coefficients.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <span>

#include "base/Utf8.h"
#include "model/OTAParamRC.h"
#include "pipeline/BatteryModelDataHandler.h"
#include "pipeline/KextBatteryModel.h"
#include "pipeline/KextBatteryModelSources.h"
#include "tools/rcmodel/ModelJSON.h"
#include "tools/rcmodel/Tool.h"

namespace kolvrand::rcmodel {

namespace {

constexpr const char* kHelp = R"HELP(usage: rcmodel plot FILE -o OUT.svg

Draws the first message of the model file FILE as an SVG picture that a web
browser shows: the OCV grid (a curve per temperature band of 101 points, when
the grid divides so), and for each of the 17 resistance tables of the record
its values at 25 °C (left axis) and its temperature coefficients (right axis, a
dashed curve per band). The state-of-charge axis assumes evenly spaced points.
A table the model lacks is shown as missing. The header lists the model's
single values and its board resistances.

The file's name in the title shows control characters and bytes that are no
UTF-8 as escapes (\n, \x1b), so that the picture is valid XML whatever the name.

Exit status: 0 when OUT.svg was written and the daemon would load the model;
1 when FILE cannot be decoded, OUT.svg cannot be written, or the daemon would
refuse the model (OUT.svg is written all the same, to show what the model
holds); 2 for a wrong command line.
)HELP";

constexpr double kWidth = 1280;
constexpr int kColumns = 4;
constexpr double kPanelWidth = kWidth / kColumns;
constexpr double kPanelHeight = 250;
constexpr double kOCVHeight = 380;
constexpr const char* kColors[] = {"#1f77b4", "#d62728", "#2ca02c", "#9467bd",
                                   "#ff7f0e", "#8c564b", "#e377c2", "#17becf"};
constexpr size_t kOCVPoints = 101;

// Text as XML character data or an attribute value: the markup characters
// as entities; control characters and bytes that are no UTF-8, which XML
// does not allow even as references, as visible escapes; and the two
// noncharacters U+FFFE and U+FFFF, which XML does not allow either.
std::string escape(std::string_view raw) {
  const std::string text = visibleText(raw);
  std::string out;
  for (size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '\xef' && i + 2 < text.size() && text[i + 1] == '\xbf' &&
        (text[i + 2] == '\xbe' || text[i + 2] == '\xbf')) {
      out += text[i + 2] == '\xbe' ? "\\ufffe" : "\\uffff";
      i += 2;
      continue;
    }
    switch (c) {
      case '&':
        out += "&amp;";
        break;
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      case '"':
        out += "&quot;";
        break;
      default:
        out += c;
    }
  }
  return out;
}

std::string num(double v) {
  char buffer[32];
  std::snprintf(buffer, sizeof buffer, "%.1f", v);
  return buffer;
}

struct Series {
  std::string label;
  std::span<const float> values;
  const char* color;
  bool dashed;
};

// A value range with tick marks at 1, 2 or 5 times a power of ten.
struct Scale {
  double low = 0, high = 1, step = 0.2;
  bool empty = true;

  static Scale of(const std::vector<Series>& series) {
    double lo = INFINITY, hi = -INFINITY;
    for (const Series& s : series)
      for (float v : s.values)
        if (std::isfinite(v)) lo = std::min(lo, double{v}), hi = std::max(hi, double{v});
    Scale scale;
    if (lo > hi) return scale;
    scale.empty = false;
    if (lo == hi) {
      const double pad = lo == 0 ? 1 : std::fabs(lo) * 0.1;
      lo -= pad, hi += pad;
    }
    const double raw = (hi - lo) / 5;
    const double power = std::pow(10, std::floor(std::log10(raw)));
    const double fraction = raw / power;
    scale.step = (fraction <= 1 ? 1 : fraction <= 2 ? 2 : fraction <= 5 ? 5 : 10) * power;
    scale.low = std::floor(lo / scale.step) * scale.step;
    scale.high = std::ceil(hi / scale.step) * scale.step;
    if (!std::isfinite(scale.low) || !std::isfinite(scale.high) || scale.low == scale.high ||
        (scale.high - scale.low) / scale.step > 50)
      scale.low = lo, scale.high = hi, scale.step = (hi - lo) / 5;
    return scale;
  }

  std::string label(double v) const {
    if (std::fabs(v) < step * 1e-6) v = 0;
    char buffer[32];
    const double magnitude = std::max(std::fabs(low), std::fabs(high));
    if (magnitude >= 1e6 || step < 1e-4) {
      std::snprintf(buffer, sizeof buffer, "%.3g", v);
    } else {
      const int decimals = std::max(0, static_cast<int>(-std::floor(std::log10(step) + 1e-9)));
      std::snprintf(buffer, sizeof buffer, "%.*f", decimals, v);
    }
    return buffer;
  }
};

class Svg {
 public:
  std::string body;

  void text(double x, double y, std::string_view s, const char* attributes = "") {
    body += "<text x=\"" + num(x) + "\" y=\"" + num(y) + "\" " + attributes + ">" + escape(s) +
            "</text>\n";
  }
  void line(double x1, double y1, double x2, double y2, const char* attributes) {
    body += "<line x1=\"" + num(x1) + "\" y1=\"" + num(y1) + "\" x2=\"" + num(x2) + "\" y2=\"" +
            num(y2) + "\" " + attributes + "/>\n";
  }
  void polyline(const std::string& points, const char* color, bool dashed) {
    body += std::string("<polyline fill=\"none\" stroke=\"") + color +
            "\" stroke-width=\"1.6\" stroke-linejoin=\"round\"" +
            (dashed ? " stroke-dasharray=\"5,3\"" : "") + " points=\"" + points + "\"/>\n";
  }
};

// A plot area with its axes: x is the state of charge (0 to 100 %) of evenly
// spaced points, y the left scale (and an optional right scale).
struct Frame {
  double x, y, w, h;  // the plot area

  double px(size_t i, size_t n) const {
    return x + (n > 1 ? static_cast<double>(i) / static_cast<double>(n - 1) : 0) * w;
  }
  double py(double v, const Scale& s) const { return y + h - (v - s.low) / (s.high - s.low) * h; }

  void axes(Svg& svg, const Scale& left, const std::string& leftLabel, const Scale* right,
            const std::string& rightLabel) const {
    svg.body += "<rect x=\"" + num(x) + "\" y=\"" + num(y) + "\" width=\"" + num(w) +
                "\" height=\"" + num(h) + "\" fill=\"#fafafa\" stroke=\"#888\"/>\n";
    for (int p = 0; p <= 100; p += 20) {
      const double gx = x + p / 100.0 * w;
      svg.line(gx, y, gx, y + h, "stroke=\"#e4e4e4\"");
      svg.line(gx, y + h, gx, y + h + 4, "stroke=\"#888\"");
      svg.text(gx, y + h + 16, std::to_string(p), "text-anchor=\"middle\" font-size=\"10\"");
    }
    svg.text(x + w / 2, y + h + 30, "state of charge (%)", "text-anchor=\"middle\"");
    yTicks(svg, left, x, -1);
    svg.text(x - 44, y + h / 2, leftLabel, "text-anchor=\"middle\" font-size=\"11\"");
    rotateLast(svg, x - 44, y + h / 2);
    if (right) {
      yTicks(svg, *right, x + w, +1);
      svg.text(x + w + 46, y + h / 2, rightLabel, "text-anchor=\"middle\" font-size=\"11\"");
      rotateLast(svg, x + w + 46, y + h / 2);
    }
  }

  // Tick marks and labels on the left (side -1) or right (+1) edge.
  void yTicks(Svg& svg, const Scale& s, double edge, int side) const {
    if (s.empty) return;
    const int count = static_cast<int>(std::round((s.high - s.low) / s.step));
    for (int i = 0; i <= count; ++i) {
      const double v = s.low + i * s.step;
      const double gy = py(v, s);
      if (side < 0) svg.line(x, gy, x + w, gy, "stroke=\"#e4e4e4\"");
      svg.line(edge, gy, edge + 4 * side, gy, "stroke=\"#888\"");
      svg.text(edge + 6 * side, gy + 3, s.label(v),
               side < 0 ? "text-anchor=\"end\" font-size=\"10\""
                        : "text-anchor=\"start\" font-size=\"10\"");
    }
  }

  static void rotateLast(Svg& svg, double cx, double cy) {
    const size_t at = svg.body.rfind("<text ");
    svg.body.insert(at + 6, "transform=\"rotate(-90 " + num(cx) + " " + num(cy) + ")\" ");
  }

  // One curve per series; non-finite values break the line.
  void curves(Svg& svg, const std::vector<Series>& series, const Scale& s) const {
    if (s.empty) return;
    for (const Series& one : series) {
      std::string points;
      auto flush = [&] {
        if (!points.empty()) svg.polyline(points, one.color, one.dashed);
        points.clear();
      };
      for (size_t i = 0; i < one.values.size(); ++i) {
        if (!std::isfinite(one.values[i])) {
          flush();
          continue;
        }
        points += num(px(i, one.values.size())) + "," + num(py(one.values[i], s)) + " ";
      }
      flush();
    }
  }
};

// `values` cut into runs of `run` when they divide evenly into more than one.
std::vector<std::span<const float>> runs(std::span<const float> values, size_t run) {
  std::vector<std::span<const float>> out;
  if (run == 0 || values.size() <= run || values.size() % run != 0) {
    out.push_back(values);
    return out;
  }
  for (size_t at = 0; at < values.size(); at += run) out.push_back(values.subspan(at, run));
  return out;
}

void legend(Svg& svg, double x, double y, const std::vector<Series>& series) {
  for (const Series& s : series) {
    svg.line(x, y - 4, x + 24, y - 4,
             (std::string("stroke=\"") + s.color + "\" stroke-width=\"2\"" +
              (s.dashed ? " stroke-dasharray=\"5,3\"" : ""))
                 .c_str());
    svg.text(x + 30, y, s.label, "font-size=\"11\"");
    x += 40 + 6.5 * static_cast<double>(s.label.size());
  }
}

// The model's single values, from its dictionary form: numbers and strings at
// the top level and the board resistances.
std::vector<std::string> summary(const OTAParamRC& model) {
  std::vector<std::string> out;
  const Value dictionary = model.dictionaryRepresentation();
  std::string top;
  for (const auto& [key, value] : *dictionary.asDictionary()) {
    std::string shown;
    if (value.isNumber())
      shown = renderJSON(value);
    else if (value.isString())
      shown = *value.asString();
    else
      continue;
    if (key == "chemID") {
      char hexID[24];
      std::snprintf(hexID, sizeof hexID, " (0x%llx)",
                    static_cast<unsigned long long>(value.asNumber()->uint64Value()));
      shown += hexID;
    }
    top += key + " " + shown + "    ";
  }
  out.push_back(top);
  if (const Value* bmu = dictionary.asDictionary()->find("bmuResistance")) {
    std::string line = "bmuResistance:";
    for (const auto& [key, value] : *bmu->asDictionary())
      line += "  " + key + " " + renderJSON(value);
    out.push_back(line);
  } else {
    out.push_back("bmuResistance: absent");
  }
  return out;
}

std::string drawing(const OTAParamRC& model, const std::string& name) {
  Svg svg;
  svg.text(24, 32, "Battery model " + name, "font-size=\"18\" font-weight=\"bold\"");
  double y = 54;
  for (std::string s : summary(model)) {
    // About 170 characters fit the width; longer lines break at a gap.
    while (!s.empty()) {
      size_t cut = s.size() <= 170 ? s.size() : s.rfind("  ", 170);
      if (cut == std::string::npos || cut == 0) cut = std::min<size_t>(s.size(), 170);
      svg.text(24, y, s.substr(0, cut), "font-size=\"12\" fill=\"#333\" xml:space=\"preserve\"");
      s = s.substr(cut);
      while (s.starts_with(' ')) s.erase(0, 1);
      if (!s.empty()) s = "    " + s;
      y += 18;
    }
  }

  // The OCV grid: the curves, and beside them how far each temperature band
  // lies from the first, which the curves themselves are too close to show.
  y += 12;
  svg.text(24, y + 12, "Open-circuit voltage (gridOCV)", "font-size=\"15\" font-weight=\"bold\"");
  std::span<const float> grid(model.gridOCVs(), model.gridOCVsCount());
  std::vector<Series> ocv;
  const auto bands = runs(grid, kOCVPoints);
  for (size_t i = 0; i < bands.size(); ++i)
    ocv.push_back({bands.size() > 1 ? "temperature band " + std::to_string(i + 1) : "OCV", bands[i],
                   kColors[i % std::size(kColors)], false});
  const bool compare = bands.size() > 1;
  Frame frame{90, y + 44, compare ? kWidth * 0.6 - 120 : kWidth - 180, kOCVHeight - 110};
  const Scale ocvScale = Scale::of(ocv);
  frame.axes(svg, ocvScale, "gridOCV", nullptr, "");
  frame.curves(svg, ocv, ocvScale);
  if (ocvScale.empty)
    svg.text(frame.x + frame.w / 2, frame.y + frame.h / 2, "no OCV points",
             "text-anchor=\"middle\" fill=\"#999\"");
  legend(svg, frame.x, y + 34, ocv);
  svg.text(frame.x + frame.w, frame.y - 6, std::to_string(grid.size()) + " points",
           "text-anchor=\"end\" font-size=\"10\" fill=\"#777\"");
  if (compare) {
    std::vector<std::vector<float>> differences;
    for (const auto& band : bands) {
      std::vector<float> d(band.size());
      for (size_t i = 0; i < band.size(); ++i) d[i] = band[i] - bands[0][i];
      differences.push_back(std::move(d));
    }
    std::vector<Series> spread;
    for (size_t i = 0; i < differences.size(); ++i)
      spread.push_back({"", differences[i], kColors[i % std::size(kColors)], false});
    Frame beside{kWidth * 0.6 + 70, y + 44, kWidth * 0.4 - 110, kOCVHeight - 110};
    const Scale spreadScale = Scale::of(spread);
    beside.axes(svg, spreadScale, "gridOCV minus band 1", nullptr, "");
    beside.curves(svg, spread, spreadScale);
    svg.text(beside.x + beside.w / 2, beside.y - 6, "each band minus band 1",
             "text-anchor=\"middle\" font-size=\"11\"");
  }
  y += kOCVHeight;

  // The resistance tables, in record order.
  svg.text(24, y + 12, "Resistance tables", "font-size=\"15\" font-weight=\"bold\"");
  const std::vector<Series> key = {
      {"resistance25C (left axis)", {}, "#000", false},
      {"temperatureCoeff band 1 (right axis)", {}, kColors[0], true},
      {"band 2", {}, kColors[1], true},
      {"band 3", {}, kColors[2], true},
  };
  legend(svg, 240, y + 12, key);
  y += 28;
  const auto tables = kextTableSources();
  const auto lists = kextTableListSources();
  for (size_t i = 0; i < tables.size(); ++i) {
    const double px = (i % kColumns) * kPanelWidth;
    const double py = y + (i / kColumns) * kPanelHeight;
    Frame f{px + 62, py + 28, kPanelWidth - 124, kPanelHeight - 72};
    const OTAResistanceData* table = tables[i].table(model);
    if (!table) {
      svg.text(px + kPanelWidth / 2, py + 18, tables[i].field,
               "text-anchor=\"middle\" font-size=\"13\" font-weight=\"bold\"");
      svg.body += "<rect x=\"" + num(f.x) + "\" y=\"" + num(f.y) + "\" width=\"" + num(f.w) +
                  "\" height=\"" + num(f.h) + "\" fill=\"#fff0f0\" stroke=\"#c88\"/>\n";
      svg.text(f.x + f.w / 2, f.y + f.h / 2, "missing: the daemon refuses the model",
               "text-anchor=\"middle\" fill=\"#a33\" font-size=\"11\"");
      continue;
    }
    const std::span<const float> r25 = lists[0].elements(*table);
    const std::span<const float> tc = lists[1].elements(*table);
    // The title, with the two lists' counts in small print.
    svg.body +=
        "<text x=\"" + num(px + kPanelWidth / 2) + "\" y=\"" + num(py + 18) +
        "\" text-anchor=\"middle\" font-size=\"13\" font-weight=\"bold\">" +
        escape(tables[i].field) + "<tspan font-size=\"9\" font-weight=\"normal\" fill=\"#777\"> " +
        std::to_string(r25.size()) + " + " + std::to_string(tc.size()) + " values</tspan></text>\n";
    std::vector<Series> left = {{"", r25, "#000", false}};
    std::vector<Series> right;
    const auto tcBands = runs(tc, r25.size());
    for (size_t b = 0; b < tcBands.size(); ++b)
      right.push_back({"", tcBands[b], kColors[b % std::size(kColors)], true});
    const Scale l = Scale::of(left), r = Scale::of(right);
    f.axes(svg, l, "resistance25C", &r, "temperatureCoeff");
    f.curves(svg, right, r);
    f.curves(svg, left, l);
  }
  const double height = y + ((tables.size() + kColumns - 1) / kColumns) * kPanelHeight + 10;

  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
         "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"" +
         num(kWidth) + "\" height=\"" + num(height) + "\" viewBox=\"0 0 " + num(kWidth) + " " +
         num(height) +
         "\" font-family=\"DejaVu Sans, Helvetica, Arial, sans-serif\" font-size=\"12\">\n"
         "<rect width=\"100%\" height=\"100%\" fill=\"white\"/>\n" +
         svg.body + "</svg>\n";
}

int run(const Arguments& a) {
  if (a.operands.size() != 1) return usageError(a.command, "give one model file");
  if (!a.output) return usageError(a.command, "give the picture to write with -o OUT.svg");
  const std::string& path = a.operands.front();
  std::shared_ptr<OTAParamRC> model = readFirstModel(a.command, path);
  if (!model) return kExitFailed;
  const std::string name = path == "-" ? "(stdin)" : path.substr(path.rfind('/') + 1);
  if (!writeOutput(a.command, *a.output, drawing(*model, name))) return kExitFailed;
  // The verdict is the daemon's own builder's, as validate's is.
  BatteryModelDataHandler quiet;
  if (!quiet.createKextModelFromProtobufModel(model.get())) {
    error(a.command, path + ": the daemon would refuse this model; the picture shows what it " +
                         "holds, rcmodel validate " + path + " tells why");
    return kExitFailed;
  }
  return kExitOK;
}

}  // namespace

const Command kPlot{"plot", kHelp, kOutputOption, run};

}  // namespace kolvrand::rcmodel
