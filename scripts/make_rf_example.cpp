// Generates the sample rational function model and its control points in
// examples/. Not part of the build; compile and run by hand from the
// repository root:
//
//   g++ -std=c++17 -O2 -I/usr/include/eigen3 scripts/make_rf_example.cpp -o /tmp/make_rf
//   /tmp/make_rf examples
//   build/tools/lumo rpc examples/rf_scene_RPC.TXT examples/rf_scene.RPB
//   build/tools/lumo rpc examples/rf_scene_RPC.TXT examples/rf_scene.json \
//       --pixels 10000 --lines 10000
//
// The scene: a 10000 x 10000 frame of about 2 m pixels near 7.45 E 46.95 N,
// seen by a pinhole camera 620 km up and some 130 km off to the south-west,
// over a curved earth. The rational functions are a least-squares fit to
// that camera over the normalised cube (cubic numerators, first-order
// denominators, which is the shape of a perspective view), and the control
// points come from the camera itself, so the model's residuals against them
// show the quality of the fit.
#include <Eigen/Dense>

#include <array>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <iostream>
#include <string>

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr double kDeg = kPi / 180.0;
constexpr double kEarthRadius = 6378137.0;
constexpr double kLon0 = 7.45, kLat0 = 46.95, kHeight0 = 800.0;
constexpr double kLonScale = 0.16, kLatScale = 0.11, kHeightScale = 500.0;
constexpr int kImageSize = 10000;
constexpr double kFocalPixels = 316000.0;

using Vec3 = Eigen::Vector3d;

struct Camera {
    Vec3 position{-120e3, -60e3, 620e3};
    Vec3 x, y, z;
    Camera() {
        z = (-position).normalized();
        const Vec3 east(1.0, 0.0, 0.0);
        x = (east - east.dot(z) * z).normalized();
        y = z.cross(x);
    }
    // Image position with pixel (0, 0) the corner of the first pixel.
    void Project(double lon, double lat, double h, double* pixel, double* line) const {
        const double e = (lon - kLon0) * kDeg * kEarthRadius * std::cos(lat * kDeg);
        const double n = (lat - kLat0) * kDeg * kEarthRadius;
        const double u = h - (e * e + n * n) / (2.0 * kEarthRadius);
        const Vec3 ray = Vec3(e, n, u) - position;
        *pixel = kImageSize / 2.0 + kFocalPixels * x.dot(ray) / z.dot(ray);
        *line = kImageSize / 2.0 + kFocalPixels * y.dot(ray) / z.dot(ray);
    }
};

std::array<double, 20> Terms(double U, double V, double W) {
    return {1,         U,         V,         W,         U * V,     U * W,     V * W,
            U * U,     V * V,     W * W,     U * V * W, U * U * U, U * V * V, U * W * W,
            U * U * V, V * V * V, V * W * W, U * U * W, V * V * W, W * W * W};
}

struct Fit {
    std::array<double, 20> num{}, den{};
};

// r = N/D with D = 1 + d1 U + d2 V + d3 W: N.T - r (d.T') = r, linear in
// the 23 unknowns.
Fit FitRatio(const std::vector<std::array<double, 4>>& samples) {
    Eigen::MatrixXd A(samples.size(), 23);
    Eigen::VectorXd b(samples.size());
    for (std::size_t k = 0; k < samples.size(); ++k) {
        const auto& s = samples[k];
        const auto t = Terms(s[0], s[1], s[2]);
        for (int i = 0; i < 20; ++i) A(k, i) = t[i];
        for (int i = 1; i <= 3; ++i) A(k, 19 + i) = -s[3] * t[i];
        b(k) = s[3];
    }
    const Eigen::VectorXd x = A.colPivHouseholderQr().solve(b);
    Fit fit;
    for (int i = 0; i < 20; ++i) fit.num[i] = x(i);
    fit.den[0] = 1.0;
    for (int i = 1; i <= 3; ++i) fit.den[i] = x(19 + i);
    return fit;
}

double Evaluate(const std::array<double, 20>& c, const std::array<double, 20>& t) {
    double sum = 0.0;
    for (int i = 0; i < 20; ++i) sum += c[i] * t[i];
    return sum;
}

}  // namespace

int main(int argc, char** argv) {
    const std::string dir = argc > 1 ? argv[1] : "examples";
    const Camera camera;
    double centrePixel = 0.0, centreLine = 0.0;
    camera.Project(kLon0, kLat0, kHeight0, &centrePixel, &centreLine);
    // RPC positions are centre-based: half a pixel less than the corner-based ones.
    const double sampOff = std::round(centrePixel) - 0.5, lineOff = std::round(centreLine) - 0.5;
    const double sampScale = kImageSize / 2.0, lineScale = kImageSize / 2.0;

    std::vector<std::array<double, 4>> sampSamples, lineSamples;
    constexpr int kGrid = 21, kLevels = 7;
    for (int i = 0; i < kGrid; ++i) {
        for (int j = 0; j < kGrid; ++j) {
            for (int k = 0; k < kLevels; ++k) {
                const double U = -1.0 + 2.0 * i / (kGrid - 1);
                const double V = -1.0 + 2.0 * j / (kGrid - 1);
                const double W = -1.0 + 2.0 * k / (kLevels - 1);
                double pixel = 0.0, line = 0.0;
                camera.Project(kLon0 + U * kLonScale, kLat0 + V * kLatScale,
                               kHeight0 + W * kHeightScale, &pixel, &line);
                sampSamples.push_back({U, V, W, (pixel - 0.5 - sampOff) / sampScale});
                lineSamples.push_back({U, V, W, (line - 0.5 - lineOff) / lineScale});
            }
        }
    }
    const Fit samp = FitRatio(sampSamples);
    const Fit line = FitRatio(lineSamples);
    double worst = 0.0;
    for (std::size_t k = 0; k < sampSamples.size(); ++k) {
        const auto t = Terms(sampSamples[k][0], sampSamples[k][1], sampSamples[k][2]);
        const double ds = (Evaluate(samp.num, t) / Evaluate(samp.den, t) - sampSamples[k][3]);
        const double dl = (Evaluate(line.num, t) / Evaluate(line.den, t) - lineSamples[k][3]);
        worst = std::max(worst, std::hypot(ds * sampScale, dl * lineScale));
    }
    std::cerr << "largest fit error: " << worst << " pixels\n";

    std::ofstream rpc(dir + "/rf_scene_RPC.TXT");
    char text[128];
    auto put = [&](const char* key, double value, const char* unit) {
        std::snprintf(text, sizeof text, "%s: %+.10g %s\n", key, value, unit);
        rpc << text;
    };
    put("LINE_OFF", lineOff, "pixels");
    put("SAMP_OFF", sampOff, "pixels");
    put("LAT_OFF", kLat0, "degrees");
    put("LONG_OFF", kLon0, "degrees");
    put("HEIGHT_OFF", kHeight0, "meters");
    put("LINE_SCALE", lineScale, "pixels");
    put("SAMP_SCALE", sampScale, "pixels");
    put("LAT_SCALE", kLatScale, "degrees");
    put("LONG_SCALE", kLonScale, "degrees");
    put("HEIGHT_SCALE", kHeightScale, "meters");
    auto putList = [&](const char* prefix, const std::array<double, 20>& c) {
        for (int i = 0; i < 20; ++i) {
            std::snprintf(text, sizeof text, "%s%d: %+.15E\n", prefix, i + 1, c[i]);
            rpc << text;
        }
    };
    putList("LINE_NUM_COEFF_", line.num);
    putList("LINE_DEN_COEFF_", line.den);
    putList("SAMP_NUM_COEFF_", samp.num);
    putList("SAMP_DEN_COEFF_", samp.den);

    std::ofstream gcps(dir + "/rf_scene_gcps.csv");
    gcps << "# Control points of the sample rational function model, from the camera\n"
            "# it was fitted to. Ground: longitude, latitude (degrees), height (m).\n"
            "id,pixel,line,x,y,z\n";
    for (int k = 0; k < 16; ++k) {
        // A scattered pattern over the scene and the height range.
        const double U = -0.85 + 1.7 * ((k * 7) % 16) / 15.0;
        const double V = -0.85 + 1.7 * ((k * 11) % 16) / 15.0;
        const double h = 450.0 + 50.0 * ((k * 5) % 15);
        const double lon = kLon0 + U * kLonScale * 0.8, lat = kLat0 + V * kLatScale * 0.8;
        double pixel = 0.0, line = 0.0;
        camera.Project(lon, lat, h, &pixel, &line);
        std::snprintf(text, sizeof text, "G%02d,%.3f,%.3f,%.8f,%.8f,%.1f\n", k + 1, pixel, line,
                      lon, lat, h);
        gcps << text;
    }
    return 0;
}
