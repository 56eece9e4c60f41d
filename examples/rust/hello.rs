// SPDX-License-Identifier: Apache-2.0
//! Reports each line of its input, through the C interface of libveltra: rustc hello.rs && ./hello
//! The session goes on when the daemon restarts. The exit status is 1 if a message was lost.

use std::ffi::{CStr, CString};
use std::io::BufRead;
use std::os::raw::{c_char, c_int, c_void};
use std::ptr::null_mut;

// As in veltra/veltra.h, whose comments say what may be passed. A field that is not set is zero.
#[repr(C)]
struct Options {
    size: usize,
    root: *const c_char,
    has_client_type: bool,
    client_type: i32,
    has_session_id: bool,
    session_id: u32,
    has_client_version: bool,
    client_version: u16,
    require_user_info: bool,
    batch_events: bool,
    user_info: *const c_void,
    client_name: *const c_char,
    service_name: *const c_char,
    aggregated: *const c_void,
    aggregated_context: *mut c_void,
    queue_bytes: usize,
    undescribed: bool,
    connect_later: bool,
    connect_timeout_ms: u32,
    state_changed: *const c_void,
    state_context: *mut c_void,
    frameworks_to_check: *const c_void,
}

#[link(name = "veltra")]
extern "C" {
    fn veltra_session_options_init(options: *mut Options);
    fn veltra_session_create(options: *const Options, status: *mut c_int, error: *mut *mut c_char) -> *mut c_void;
    fn veltra_free(text: *mut c_char);
    fn veltra_session_start(session: *mut c_void, callback: *const c_void, context: *mut c_void) -> c_int;
    fn veltra_session_send(
        session: *mut c_void, category: u16, kind: u16, payload: *const c_void, flag: u32,
        callback: *const c_void, context: *mut c_void,
    ) -> c_int;
    fn veltra_session_close(session: *mut c_void) -> u64;
    fn veltra_dictionary() -> *mut c_void;
    fn veltra_dictionary_set(dictionary: *mut c_void, key: *const c_char, value: *mut c_void) -> c_int;
    fn veltra_string_with_length(text: *const c_char, length: usize) -> *mut c_void;
    fn veltra_release(value: *const c_void);
}

/// A session, closed when it goes out of scope.
struct Session(*mut c_void);

impl Session {
    fn new(client_type: i32, name: &str) -> Result<Session, String> {
        let name = CString::new(name).map_err(|error| error.to_string())?;
        unsafe {
            let mut options: Options = std::mem::zeroed();
            veltra_session_options_init(&mut options);
            options.has_client_type = true;
            options.client_type = client_type;
            options.client_name = name.as_ptr();
            let mut error: *mut c_char = null_mut();
            let session = veltra_session_create(&options, null_mut(), &mut error);
            if session.is_null() {
                let text = CStr::from_ptr(error).to_string_lossy().into_owned();
                veltra_free(error);
                return Err(text);
            }
            veltra_session_start(session, null_mut(), null_mut());
            Ok(Session(session))
        }
    }

    /// Does not wait. False: the message was dropped.
    fn send(&self, category: u16, kind: u16, key: &str, text: &str) -> bool {
        let key = CString::new(key).expect("a key without NUL");
        unsafe {
            let payload = veltra_dictionary();
            let value = veltra_string_with_length(text.as_ptr() as *const c_char, text.len());
            veltra_dictionary_set(payload, key.as_ptr(), value);
            let status = veltra_session_send(self.0, category, kind, payload, 0, null_mut(), null_mut());
            veltra_release(payload);
            status == 0
        }
    }

    /// The number of messages that were lost.
    fn close(mut self) -> u64 {
        unsafe { veltra_session_close(std::mem::replace(&mut self.0, null_mut())) }
    }
}

impl Drop for Session {
    fn drop(&mut self) {
        unsafe { veltra_session_close(self.0) }; // NULL does nothing
    }
}

fn main() {
    let session = Session::new(7, "hello").unwrap_or_else(|error| {
        eprintln!("{}", error);
        std::process::exit(1);
    });
    let mut dropped = 0;
    for line in std::io::stdin().lock().lines().flatten() {
        if !session.send(5, 10, "line", &line) {
            dropped += 1;
        }
    }
    std::process::exit(if session.close() + dropped > 0 { 1 } else { 0 });
}
