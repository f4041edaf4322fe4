// The sign-in form.
import { Refusal, UNAUTHORIZED, signIn } from './api.js';
import { byId, setText } from './dom.js';
import { counted } from './format.js';

const TOO_MANY = 429;

const view = byId('sign-in');
const form = byId('sign-in-form');
const error = byId('sign-in-error');
const user = byId('user');
const password = byId('sign-in-password');

export class SignIn {
  #onSignedIn;

  constructor({ onSignedIn }) {
    this.#onSignedIn = onSignedIn;
    form.addEventListener('submit', (event) => {
      event.preventDefault();
      this.#submit();
    });
  }

  // A user whose session has ended need not give the name again.
  show(message, userName = '') {
    view.hidden = false;
    document.title = 'Sign in';
    user.value = userName;
    password.value = '';
    setText(error, message);
    (user.value ? password : user).focus();
  }

  // Lets go of the focus itself, as a browser does so for a hidden field only later.
  hide() {
    document.activeElement.blur();
    view.hidden = true;
    password.value = '';
  }

  async #submit() {
    if (form.hasAttribute('aria-busy')) return;
    setText(error, '');
    if (!user.value || !password.value) {
      setText(error, 'Give your user name and password.');
      (user.value ? password : user).focus();
      return;
    }
    form.setAttribute('aria-busy', 'true');
    try {
      this.#onSignedIn(await signIn(user.value, password.value));
    } catch (refusal) {
      if (!(refusal instanceof Refusal)) throw refusal;
      setText(error, reasonOf(refusal));
      password.select();
      password.focus();
    } finally {
      form.removeAttribute('aria-busy');
    }
  }
}

function reasonOf({ status, retryAfter, message }) {
  if (status === UNAUTHORIZED) return 'Wrong user name or password.';
  if (status !== TOO_MANY) return `Signing in did not work: ${message}.`;
  const when = retryAfter > 0 ? `in ${counted(retryAfter, 'second')}` : 'later';
  return `Too many wrong passwords. Try again ${when}.`;
}
