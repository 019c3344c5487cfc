// The demonstration: each family's sample model from the examples directory,
// evaluated both ways on its sample control points and on a grid over the
// image, with residuals and round-trip errors.
#pragma once

#include <cstddef>
#include <iosfwd>
#include <string>
#include <vector>

namespace lumo::cli {

// One row of the demonstration: a sample model and its control points.
// Later families append a row to FamilyDemos().
struct FamilyDemo {
    const char* pszFamily;
    const char* pszModelFile;  // in the examples directory
    const char* pszGcpFile;    // id,pixel,line,x,y[,z]
};

const std::vector<FamilyDemo>& FamilyDemos();

// Largest and root-mean-square of a series of distances.
struct ErrorStats {
    std::size_t nCount = 0;
    double dfMax = 0.0;
    double dfSumSquares = 0.0;

    void Add(double distance);
    double Rms() const;
};

struct DemoResult {
    std::string osFamily;
    std::string osModelFile;
    std::size_t nGcps = 0;
    ErrorStats sImageResidual;    // model image position against the GCP's, pixels
    ErrorStats sGroundResidual;   // model ground position against the GCP's, ground units
    ErrorStats sGroundRoundTrip;  // ground -> image -> ground, ground units
    ErrorStats sImageRoundTrip;   // image -> ground -> image, pixels
};

// Evaluates one family demo with the files in `examplesDir`.
DemoResult RunFamilyDemo(const FamilyDemo& demo, const std::string& examplesDir);

// The examples directory: $LUMO_EXAMPLES_DIR, then the source tree the tool
// was built from, then <prefix>/share/lumo/examples beside the executable.
// Throws naming every place looked at when none exists.
std::string FindExamplesDir();

// Runs every family demo and prints the table to `out`; files the demo
// writes (the orthoimage and its quick-look) go to outputDir.
void PrintDemo(const std::string& examplesDir, std::ostream& out,
               const std::string& outputDir = ".");

}  // namespace lumo::cli
