#pragma once
// Finding the orbit file that covers a product, in a folder of orbit files.
#include <optional>
#include <string>
#include <vector>

namespace sar::jobs {

/// An orbit product found by its header.
struct OrbitCandidate {
  std::string path;
  std::string name;  // MPH product name
  int preference = 0;  // 0 DOR_VOR, 1 DOR_POR, 2 AUX_FPO, 3 AUX_FRO
  double start = 0.0;  // validity, sec85
  double stop = 0.0;
};

/// Orbit products below `dir`, typed by their MPH product name.
std::vector<OrbitCandidate> scan_orbit_products(const std::string& dir);

/// The orbit whose validity strictly holds `sensingStart` (sec85): precise before preliminary
/// (DOR_VOR, DOR_POR, AUX_FPO, AUX_FRO), then the newest issue. nullopt when none covers it.
std::optional<OrbitCandidate> choose_orbit(const std::vector<OrbitCandidate>& candidates, double sensingStart);

/// Sensing start (sec85) of an ENVISAT product, from its MPH; nullopt when unreadable.
std::optional<double> product_sensing_start(const std::string& product);

/// choose_orbit, with a one-line `error` when none covers `sensingStart`: it names the date,
/// the folder `where`, and the nearest validity ending before and starting after the date.
std::optional<OrbitCandidate> pick_orbit(const std::vector<OrbitCandidate>& candidates, double sensingStart,
                                         const std::string& where, std::string& error);

/// The orbit file below `dir` that covers the sensing start of `product`; nullopt with a
/// one-line `error` when the product's date cannot be read or no file covers it.
std::optional<OrbitCandidate> find_orbit_for(const std::string& product, const std::string& dir, std::string& error);

}  // namespace sar::jobs
