// Georeferencing texts the user gives (options, fields of project and model
// files): the projection description they stand for, with messages that say
// where the text came from and why it is refused.
#pragma once

#include <ostream>
#include <string>
#include <vector>

#include "nova/projection.h"
#include "points_io.h"

namespace lumo::cli {

// The description of `text`; fails naming `where` (an option or a file
// field) and the reason when the projection services refuse it.
ProjInfo_t UserGeosys(const std::string& text, const std::string& where);

// Copies the description's normalised text into a record's buffer of
// `bufferSize` bytes; fails naming `where` when it does not fit.
void StoreGeosys(const ProjInfo_t& proj, char* buffer, int bufferSize, const std::string& where);

// Warns on `err`, behind `prefix`, when ground points given in a UTM text
// with a latitude band lie far outside that band.
void WarnOutsideUTMBand(const ProjInfo_t& proj, const std::vector<double>& x,
                        const std::vector<double>& y, const std::string& prefix, std::ostream& err);
// The same for the ground coordinates of a point file.
void WarnOutsideUTMBand(const ProjInfo_t& proj, const PointSet& points, const std::string& prefix,
                        std::ostream& err);

// Where the georeferencing text `geosys` of `points` came from, for
// messages: the file's "# geosys:" line when it is the file's, else --geosys.
std::string GeosysWhere(const PointSet& points, const std::string& geosys);

}  // namespace lumo::cli
