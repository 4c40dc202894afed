// Owners for the things that GLib hands out by pointer. Each frees what it holds exactly once; none
// of them may be shared between threads without a lock of the user's own.
#pragma once

#include <gio/gio.h>

#include <memory>
#include <utility>

template <auto release>
struct GlibDeleter {
  template <typename T>
  void operator()(T *pointer) const {
    release(pointer);
  }
};

template <typename T>
using GFreePtr = std::unique_ptr<T, GlibDeleter<g_free>>;
using GCharPtr = GFreePtr<char>;
using GStrvPtr = std::unique_ptr<char *, GlibDeleter<g_strfreev>>;
using GVariantPtr = std::unique_ptr<GVariant, GlibDeleter<g_variant_unref>>;
using GKeyFilePtr = std::unique_ptr<GKeyFile, GlibDeleter<g_key_file_unref>>;
using GDirPtr = std::unique_ptr<GDir, GlibDeleter<g_dir_close>>;
using GDBusNodeInfoPtr = std::unique_ptr<GDBusNodeInfo, GlibDeleter<g_dbus_node_info_unref>>;
using GMainContextPtr = std::unique_ptr<GMainContext, GlibDeleter<g_main_context_unref>>;
using GMainLoopPtr = std::unique_ptr<GMainLoop, GlibDeleter<g_main_loop_unref>>;
using GSourcePtr = std::unique_ptr<GSource, GlibDeleter<g_source_unref>>;
using GMarkupContextPtr =
    std::unique_ptr<GMarkupParseContext, GlibDeleter<g_markup_parse_context_free>>;
template <typename T>
using GObjectPtr = std::unique_ptr<T, GlibDeleter<g_object_unref>>;

// One more reference to an object.
template <typename T>
GObjectPtr<T> gobject_reference(T *object) {
  return GObjectPtr<T>(static_cast<T *>(g_object_ref(object)));
}

// A GError to pass to a GLib call. Empty until a call sets it; asking for out() again drops what
// the last call left, so one variable serves several calls in turn.
class Error {
 public:
  Error() = default;
  explicit Error(GError *error) : error_(error) {}
  Error(const Error &) = delete;
  Error &operator=(const Error &) = delete;
  ~Error() { g_clear_error(&error_); }

  GError **out() {
    g_clear_error(&error_);
    return &error_;
  }
  explicit operator bool() const { return error_ != nullptr; }
  const GError *get() const { return error_; }
  const char *message() const { return error_ ? error_->message : "unknown error"; }
  bool matches(GQuark domain, int code) const { return g_error_matches(error_, domain, code); }

 private:
  GError *error_ = nullptr;
};
