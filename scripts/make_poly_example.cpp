// Generates the sample polynomial model and its control points in examples/.
// Not part of the build; compile and run by hand from the repository root:
//
//   g++ -std=c++17 -O2 -I/usr/include/eigen3 scripts/make_poly_example.cpp -o /tmp/make_poly
//   /tmp/make_poly examples
//
// The scene: a 6000 x 6000 image of 10 m pixels in UTM zone 31 north, turned
// by half a degree, with mild second- and third-order distortion. The
// image-to-ground polynomial is the scene itself (a complete cubic in pixel
// and line); the ground-to-image polynomial is its least-squares inverse over
// a dense grid, so both directions of the model agree to a small fraction of
// a pixel.
#include <Eigen/Dense>

#include <array>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <string>
#include <vector>

namespace {

constexpr int kImageSize = 6000;
constexpr int kCubicTerms = 10;
constexpr double kPixelSize = 10.0;
constexpr double kOriginX = 440000.0;   // upper-left corner, easting
constexpr double kOriginY = 5720000.0;  // upper-left corner, northing
constexpr double kRotationDeg = 0.5;

// Powers (i, j) of u^i v^j for the first ten terms of the library's order.
constexpr std::array<std::array<int, 2>, kCubicTerms> kTermPowers = {
    {{0, 0}, {1, 0}, {0, 1}, {1, 1}, {2, 0}, {0, 2}, {2, 1}, {1, 2}, {3, 0}, {0, 3}}};

double Term(int k, double u, double v) {
    return std::pow(u, kTermPowers[k][0]) * std::pow(v, kTermPowers[k][1]);
}

// The scene geometry: ground X, Y of an image position.
void SceneImageToGround(double p, double l, double* x, double* y) {
    const double a = kRotationDeg * M_PI / 180.0;
    // Normalised image position in -1..1 for the distortion terms.
    const double s = (p - kImageSize / 2.0) / (kImageSize / 2.0);
    const double t = (l - kImageSize / 2.0) / (kImageSize / 2.0);
    const double dx = 4.0 * s * s - 2.5 * s * t + 3.0 * s * s * s;   // metres
    const double dy = -3.0 * t * t + 1.5 * s * t - 2.0 * t * t * t;  // metres
    *x = kOriginX + kPixelSize * (p * std::cos(a) + l * std::sin(a)) + dx;
    *y = kOriginY + kPixelSize * (p * std::sin(a) - l * std::cos(a)) + dy;
}

double Binomial(int n, int k) {
    double r = 1.0;
    for (int i = 1; i <= k; ++i) r = r * (n - k + i) / i;
    return r;
}

// Coefficients in raw inputs of a cubic given in centred, scaled inputs
// u' = (u - cu) / su, v' = (v - cv) / sv.
std::array<double, kCubicTerms> ExpandToRawInputs(const Eigen::VectorXd& c, double cu, double su,
                                                  double cv, double sv) {
    std::array<double, kCubicTerms> out{};
    for (int k = 0; k < kCubicTerms; ++k) {
        const int i = kTermPowers[k][0];
        const int j = kTermPowers[k][1];
        const double scale = c(k) / (std::pow(su, i) * std::pow(sv, j));
        for (int a = 0; a <= i; ++a) {
            for (int b = 0; b <= j; ++b) {
                const double w = scale * Binomial(i, a) * std::pow(-cu, i - a) * Binomial(j, b) *
                                 std::pow(-cv, j - b);
                for (int m = 0; m < kCubicTerms; ++m) {
                    if (kTermPowers[m][0] == a && kTermPowers[m][1] == b) out[m] += w;
                }
            }
        }
    }
    return out;
}

struct Sample {
    double p, l, x, y;
};

std::vector<Sample> GridSamples(int steps) {
    std::vector<Sample> samples;
    for (int i = 0; i <= steps; ++i) {
        for (int j = 0; j <= steps; ++j) {
            Sample s{};
            s.p = kImageSize * static_cast<double>(i) / steps;
            s.l = kImageSize * static_cast<double>(j) / steps;
            SceneImageToGround(s.p, s.l, &s.x, &s.y);
            samples.push_back(s);
        }
    }
    return samples;
}

// Least-squares cubic from (u, v) to w in centred, scaled inputs, expanded
// back to raw inputs (the model applies no centring of its own).
std::array<double, kCubicTerms> FitCubic(const std::vector<std::array<double, 3>>& uvw) {
    double cu = 0, cv = 0;
    for (const auto& s : uvw) {
        cu += s[0];
        cv += s[1];
    }
    cu /= uvw.size();
    cv /= uvw.size();
    double su = 0, sv = 0;
    for (const auto& s : uvw) {
        su = std::max(su, std::fabs(s[0] - cu));
        sv = std::max(sv, std::fabs(s[1] - cv));
    }
    Eigen::MatrixXd a(uvw.size(), kCubicTerms);
    Eigen::VectorXd b(uvw.size());
    for (size_t r = 0; r < uvw.size(); ++r) {
        for (int k = 0; k < kCubicTerms; ++k) {
            a(r, k) = Term(k, (uvw[r][0] - cu) / su, (uvw[r][1] - cv) / sv);
        }
        b(r) = uvw[r][2];
    }
    const Eigen::VectorXd c = a.colPivHouseholderQr().solve(b);
    return ExpandToRawInputs(c, cu, su, cv, sv);
}

double Evaluate(const std::array<double, kCubicTerms>& c, double u, double v) {
    double sum = 0;
    for (int k = 0; k < kCubicTerms; ++k) sum += c[k] * Term(k, u, v);
    return sum;
}

std::string JsonArray(const std::array<double, kCubicTerms>& c) {
    std::string s = "[";
    for (int k = 0; k < kCubicTerms; ++k) {
        char buf[40];
        std::snprintf(buf, sizeof buf, "%.17g", c[k]);
        s += (k ? ", " : "") + std::string(buf);
    }
    return s + "]";
}

}  // namespace

int main(int argc, char** argv) {
    const std::string dir = argc > 1 ? argv[1] : "examples";
    const std::vector<Sample> grid = GridSamples(40);

    std::vector<std::array<double, 3>> toX, toY, toPixel, toLine;
    for (const Sample& s : grid) {
        toX.push_back({s.p, s.l, s.x});
        toY.push_back({s.p, s.l, s.y});
        toPixel.push_back({s.x, s.y, s.p});
        toLine.push_back({s.x, s.y, s.l});
    }
    const auto xCoeffs = FitCubic(toX);  // exact: the scene is a cubic
    const auto yCoeffs = FitCubic(toY);
    const auto pixelCoeffs = FitCubic(toPixel);
    const auto lineCoeffs = FitCubic(toLine);

    double worstGround = 0, worstImage = 0;
    for (const Sample& s : GridSamples(97)) {
        worstGround = std::max({worstGround, std::fabs(Evaluate(xCoeffs, s.p, s.l) - s.x),
                                std::fabs(Evaluate(yCoeffs, s.p, s.l) - s.y)});
        worstImage = std::max({worstImage, std::fabs(Evaluate(pixelCoeffs, s.x, s.y) - s.p),
                               std::fabs(Evaluate(lineCoeffs, s.x, s.y) - s.l)});
    }
    std::cerr << "largest image-to-ground error " << worstGround << " m, ground-to-image error "
              << worstImage << " pixels\n";

    std::ofstream model(dir + "/poly_utm31.json");
    model << "{\n  \"format\": \"lumo-model\",\n  \"version\": 1,\n  \"family\": \"poly\",\n"
          << "  \"geosys\": \"UTM 31 U D000\",\n  \"pixels\": " << kImageSize
          << ",\n  \"lines\": " << kImageSize
          << ",\n  \"poly\": {\n    \"nCoeffs\": " << kCubicTerms
          << ",\n    \"pixelCoeffs\": " << JsonArray(pixelCoeffs)
          << ",\n    \"lineCoeffs\": " << JsonArray(lineCoeffs)
          << ",\n    \"xCoeffs\": " << JsonArray(xCoeffs)
          << ",\n    \"yCoeffs\": " << JsonArray(yCoeffs) << "\n  }\n}\n";

    // Control points at scattered image positions; ground from the scene,
    // heights only for show (the polynomial model ignores them).
    const double positions[][2] = {{152.5, 240.25},   {5811.0, 97.5},     {3020.75, 2988.5},
                                   {450.0, 5702.25},  {5600.5, 5890.0},   {1200.25, 1333.0},
                                   {4480.0, 1510.75}, {2255.5, 4470.0},   {3890.25, 5120.5},
                                   {990.0, 3405.5},   {5105.75, 3310.25}, {2710.0, 620.5},
                                   {1888.5, 2411.0},  {4025.0, 4011.75},  {320.75, 1890.0}};
    std::ofstream gcps(dir + "/poly_utm31_gcps.csv");
    gcps << "# Control points of poly_utm31.json: image position, UTM 31 north ground "
            "position (m), height (m)\n"
         << "id,pixel,line,x,y,z\n";
    int n = 0;
    for (const auto& pos : positions) {
        double x = 0, y = 0;
        SceneImageToGround(pos[0], pos[1], &x, &y);
        ++n;
        char line[160];
        std::snprintf(line, sizeof line, "G%02d,%.2f,%.2f,%.3f,%.3f,%.1f\n", n, pos[0], pos[1], x,
                      y, 40.0 + 7.5 * (n % 9));
        gcps << line;
    }
    return 0;
}
