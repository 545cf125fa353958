// The icon-rendering service: opens application bundles, renders their home-screen icon the
// way this device shows it, and encodes images into in-memory files.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/icon/image.h"

namespace appsync {

// The type identifier of PNG files, the one encoding the service offers.
inline constexpr std::string_view kPNGTypeIdentifier = "public.png";

// An application bundle directory as opened by the service. Immutable; safe to share between
// threads.
class QIBundle {
 public:
  explicit QIBundle(std::string path) : path_(std::move(path)) {}
  QIBundle(const QIBundle&) = delete;
  QIBundle& operator=(const QIBundle&) = delete;

  // The directory the bundle was opened at.
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// A rendered picture. Immutable; safe to share between threads.
class QIImage {
 public:
  explicit QIImage(icon::Image image) : image_(std::move(image)) {}
  QIImage(const QIImage&) = delete;
  QIImage& operator=(const QIImage&) = delete;

  const icon::Image& image() const { return image_; }

 private:
  icon::Image image_;
};

// An image encoder writing into an in-memory buffer that it owns. Made for a fixed number of
// images: add them, finalize once, then read the bytes. Not safe for concurrent use; one
// thread (or one serial sequence) at a time.
class QIImageDestination {
 public:
  QIImageDestination() = default;
  virtual ~QIImageDestination() = default;
  QIImageDestination(const QIImageDestination&) = delete;
  QIImageDestination& operator=(const QIImageDestination&) = delete;

  // Queues an image for encoding; the destination keeps what it needs of it. Images added after
  // finalize are ignored.
  virtual void addImage(const QIImage& image) = 0;

  // Encodes the queued images into data(). False when they could not be encoded: none were
  // added, more than the capacity were added, the encoder failed, or finalize was already
  // called. data() is empty after a failure.
  virtual bool finalize() = 0;

  // The encoded file after a successful finalize; empty before. The reference stays valid for
  // the destination's lifetime.
  virtual const std::vector<std::uint8_t>& data() const = 0;
};

// The door to icon rendering. Implementations are safe to call from several threads at once.
// Objects handed out are owned by the caller (shared or unique pointers) and do not refer back
// to the service, so they may outlive it.
class QIIconService {
 public:
  QIIconService() = default;
  virtual ~QIIconService() = default;
  QIIconService(const QIIconService&) = delete;
  QIIconService& operator=(const QIIconService&) = delete;

  // Opens the bundle directory at `path`. Null when there is no directory there. A directory
  // that holds no application is still opened; rendering it fails.
  virtual std::shared_ptr<QIBundle> openBundle(const std::string& path) = 0;

  // The bundle's home-screen icon at this device's size and style: square, masked to the
  // home-screen outline. Null when the bundle has no usable icon (no Info.plist, no icon named
  // in it, or no named file that exists and decodes).
  virtual std::shared_ptr<QIImage> QICreateDeviceAppropriateHomeScreenIconImageFromBundle(
      const QIBundle& bundle) = 0;

  // An encoder for files of `typeIdentifier` holding `capacity` images. Null for a type the
  // service cannot write, or a capacity the type cannot hold (zero always; PNG holds exactly one).
  virtual std::unique_ptr<QIImageDestination> createImageDestination(
      std::string_view typeIdentifier, std::size_t capacity) = 0;
};

}  // namespace appsync
