//! Sends one message with the argument as its text, and waits for the daemon's answer. Without crates:
//!
//!     rustc main.rs -l VeskReporting
use std::ffi::{c_char, c_int, c_void, CStr, CString};
use std::{env, process, ptr};

/// What this program needs of `veskreporting.h`.
mod c {
    use super::{c_char, c_int, c_void};

    pub const DONE: i32 = 0;
    pub const QUEUED: i32 = 1;
    pub const INVALID_ARGUMENT: i32 = 6;

    #[repr(C)]
    pub struct Identity {
        pub size: usize,
        pub client_type: i32,
        pub client_name: *const c_char,
        pub service_name: *const c_char,
        pub session_id: u32,
        pub client_version: u16,
        pub batch_events: u8,
        pub no_user_info: u8,
    }

    extern "C" {
        pub fn vesk_status_text(status: i32) -> *const c_char;
        pub fn vesk_result_detail(result: *const c_void) -> *const c_char;
        pub fn vesk_result_text(result: *const c_void) -> *const c_char;
        pub fn vesk_result_accepted(result: *const c_void) -> c_int;
        pub fn vesk_result_free(result: *mut c_void);
        pub fn vesk_dictionary_new() -> *mut c_void;
        pub fn vesk_dictionary_free(dictionary: *mut c_void);
        pub fn vesk_dictionary_set_text(dictionary: *mut c_void, key: *const c_char, text: *const c_char) -> i32;
        pub fn vesk_dictionary_set_integer(dictionary: *mut c_void, key: *const c_char, number: i64) -> i32;
        pub fn vesk_dictionary_view(dictionary: *const c_void) -> *const c_void;
        pub fn vesk_session_new(options: *const c_void) -> *mut c_void;
        pub fn vesk_session_free(session: *mut c_void);
        pub fn vesk_session_identify(session: *mut c_void, identity: *const Identity) -> i32;
        pub fn vesk_session_start_wait(session: *mut c_void, timeout_ms: i64, result: *mut *mut c_void) -> i32;
        pub fn vesk_session_send_wait(
            session: *mut c_void,
            category: u16,
            message_type: u16,
            payload: *const c_void,
            timeout_ms: i64,
            result: *mut *mut c_void,
        ) -> i32;
    }
}

type Outcome<T> = Result<T, String>;

fn owned(text: *const c_char) -> Option<String> {
    // Safety: the library's texts are NUL-terminated or null, and live at least until its result is freed.
    (!text.is_null()).then(|| unsafe { CStr::from_ptr(text) }.to_string_lossy().into_owned())
}

fn status_text(status: i32) -> String {
    owned(unsafe { c::vesk_status_text(status) }).unwrap_or_default()
}

fn c_text(text: &str) -> Outcome<CString> {
    CString::new(text).map_err(|_| status_text(c::INVALID_ARGUMENT))
}

fn check(status: i32, expected: i32) -> Outcome<()> {
    if status == expected { Ok(()) } else { Err(status_text(status)) }
}

/// The result of a waiting call, which `wait` makes.
struct Answer(*mut c_void);

impl Answer {
    fn of(wait: impl FnOnce(*mut *mut c_void) -> i32) -> Outcome<Answer> {
        let mut answer = Answer(ptr::null_mut());
        let status = wait(&mut answer.0);
        let detail = owned(unsafe { c::vesk_result_detail(answer.0) }).unwrap_or_default();
        check(status, c::DONE).map(|()| answer).map_err(|text| format!("{text} {detail}"))
    }
}

impl Drop for Answer {
    fn drop(&mut self) {
        unsafe { c::vesk_result_free(self.0) }
    }
}

struct Payload(*mut c_void);

impl Payload {
    fn new() -> Payload {
        Payload(unsafe { c::vesk_dictionary_new() })
    }
    fn set_text(&mut self, key: &str, text: &str) -> Outcome<()> {
        let (key, text) = (c_text(key)?, c_text(text)?);
        check(unsafe { c::vesk_dictionary_set_text(self.0, key.as_ptr(), text.as_ptr()) }, c::DONE)
    }
    fn set_integer(&mut self, key: &str, number: i64) -> Outcome<()> {
        let key = c_text(key)?;
        check(unsafe { c::vesk_dictionary_set_integer(self.0, key.as_ptr(), number) }, c::DONE)
    }
}

impl Drop for Payload {
    fn drop(&mut self) {
        unsafe { c::vesk_dictionary_free(self.0) }
    }
}

struct Session(*mut c_void);

impl Session {
    /// The user's consent and the storebag's rules for the client apply.
    fn new(client_type: i32, client_name: &str) -> Outcome<Session> {
        let session = Session(unsafe { c::vesk_session_new(ptr::null()) });
        let name = c_text(client_name)?;
        let identity = c::Identity {
            size: std::mem::size_of::<c::Identity>(),
            client_type,
            client_name: name.as_ptr(),
            service_name: ptr::null(),
            session_id: 1,
            client_version: 1,
            batch_events: 0,
            no_user_info: 0,
        };
        check(unsafe { c::vesk_session_identify(session.0, &identity) }, c::QUEUED)?;
        Ok(session)
    }
    /// Returns whether there is a storebag for the client type.
    fn start(&self, timeout_ms: i64) -> Outcome<bool> {
        let answer = Answer::of(|result| unsafe { c::vesk_session_start_wait(self.0, timeout_ms, result) })?;
        Ok(unsafe { c::vesk_result_accepted(answer.0) } != 0)
    }
    /// Returns the backends' answer, if one gave any.
    fn send(&self, category: u16, message_type: u16, payload: &Payload, timeout_ms: i64) -> Outcome<Option<String>> {
        let answer = Answer::of(|result| unsafe {
            let view = c::vesk_dictionary_view(payload.0);
            c::vesk_session_send_wait(self.0, category, message_type, view, timeout_ms, result)
        })?;
        Ok(owned(unsafe { c::vesk_result_text(answer.0) }))
    }
}

impl Drop for Session {
    /// Waits until the daemon has taken what is queued.
    fn drop(&mut self) {
        unsafe { c::vesk_session_free(self.0) }
    }
}

fn report(text: &str) -> Outcome<()> {
    let session = Session::new(5, "Camera")?;
    // A service would not wait.
    if !session.start(20_000)? {
        return Err("no storebag for the client type".into());
    }
    let mut payload = Payload::new();
    payload.set_text("text", text)?;
    payload.set_integer("frames", 240)?;
    println!("{}", session.send(3, 1, &payload, 5_000)?.as_deref().unwrap_or("accepted"));
    Ok(())
}

fn main() {
    if let Err(cause) = report(env::args().nth(1).as_deref().unwrap_or("hello")) {
        eprintln!("rust_client: {cause}");
        process::exit(1);
    }
}
